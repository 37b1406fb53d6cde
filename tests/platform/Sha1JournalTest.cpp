// Our SHA-1 (the processor's instructions where it has them, else portable
// code) and journald's native protocol. The standard SHA-1 vectors are in
// DeviceTest.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <random>
#include <string>
#include <vector>

#include "platform/CommonCrypto.h"
#include "platform/Journal.h"
#include "platform/Sha1.h"

namespace kolvrand {
namespace {

TEST(SHA1, HardwareAndPortableCompressionAgree) {
  if (!platform::sha1::hasHardware()) GTEST_SKIP() << "no SHA instructions here";
  std::mt19937 random(7);
  std::vector<uint8_t> data(64 * 9);
  for (auto& b : data) b = static_cast<uint8_t>(random());
  for (size_t blocks = 1; blocks <= 9; ++blocks) {
    uint32_t a[5], b[5];
    std::memcpy(a, platform::sha1::kInitialState, sizeof a);
    std::memcpy(b, platform::sha1::kInitialState, sizeof b);
    platform::sha1::compressPortable(a, data.data(), blocks);
    platform::sha1::compressHardware(b, data.data(), blocks);
    EXPECT_EQ(std::memcmp(a, b, sizeof a), 0) << blocks << " blocks";
  }
}

TEST(SHA1, ContextRefusesUseOutsideInitAndFinal) {
  CC_SHA1_CTX ctx;
  uint8_t md[CC_SHA1_DIGEST_LENGTH];
  EXPECT_EQ(CC_SHA1_Update(&ctx, "a", 1), 0);
  EXPECT_EQ(CC_SHA1_Final(md, &ctx), 0);
  ASSERT_EQ(CC_SHA1_Init(&ctx), 1);
  EXPECT_EQ(CC_SHA1_Update(&ctx, nullptr, 1), 0);
  EXPECT_EQ(CC_SHA1_Update(&ctx, nullptr, 0), 1);
  EXPECT_EQ(CC_SHA1_Final(nullptr, &ctx), 0);
  ASSERT_EQ(CC_SHA1_Final(md, &ctx), 1);
  EXPECT_EQ(CC_SHA1_Update(&ctx, "a", 1), 0);
  EXPECT_EQ(CC_SHA1_Init(nullptr), 0);
}

class JournalSocket : public testing::Test {
 protected:
  void SetUp() override {
    path_ = (std::filesystem::temp_directory_path() /
             ("kolvrand-journal-" + std::to_string(::getpid())))
                .string();
    ::unlink(path_.c_str());
    fd_ = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    ASSERT_GE(fd_, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, path_.c_str());
    ASSERT_EQ(::bind(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  }
  void TearDown() override {
    ::close(fd_);
    ::unlink(path_.c_str());
  }
  std::string received() {
    char buffer[4096];
    const ssize_t n = ::recv(fd_, buffer, sizeof buffer, MSG_DONTWAIT);
    return n < 0 ? "(nothing)" : std::string(buffer, static_cast<size_t>(n));
  }

  std::string path_;
  int fd_ = -1;
};

TEST_F(JournalSocket, SendsOneDatagramPerEntryWithBinaryValuesForLineFeeds) {
  const std::string_view fields[] = {"PRIORITY=3", "MESSAGE=two\nlines", "EMPTY="};
  ASSERT_EQ(platform::journalSend(fields, path_.c_str()), 0);
  const std::string expected = std::string("PRIORITY=3\nMESSAGE\n") +
                               std::string("\x09\0\0\0\0\0\0\0", 8) + "two\nlines\nEMPTY=\n";
  EXPECT_EQ(received(), expected);
}

TEST_F(JournalSocket, RefusesFieldsWithoutAValueAndMissingSockets) {
  const std::string_view noValue[] = {"MESSAGE"};
  EXPECT_EQ(platform::journalSend(noValue, path_.c_str()), -EINVAL);
  EXPECT_EQ(received(), "(nothing)");
  const std::string_view fields[] = {"MESSAGE=x"};
  EXPECT_LT(platform::journalSend(fields, (path_ + ".missing").c_str()), 0);
}

}  // namespace
}  // namespace kolvrand
