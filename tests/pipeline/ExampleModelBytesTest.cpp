// SPDX-License-Identifier: MIT
// The committed example models, written on a little-endian 64-bit host, read
// the same on every target: each decodes and encodes again to the very bytes
// of its file, and gives the kernel record whose SHA-1 is fixed below. The
// digests are the same on every architecture: the record is little-endian by
// definition.
#include <gtest/gtest.h>

#include <string>

#include "base/CommonCrypto.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/PBStreamReader.h"
#include "pipeline/PBStreamWriter.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

// File, chem ID, SHA-1 of the record.
constexpr std::tuple<const char*, uint32_t, const char*> kExamples[] = {
    {"examples/models/K517/1821.rcmodel", 0x1821, "83b8e6fb91ab8c06e267bb8bed872113b25a5fa9"},
    {"examples/models/R70/1552.rcmodel", 0x1552, "82e31811550188d291511afceeabad1880f62221"},
    {"examples/models/R71/1532.rcmodel", 0x1532, "e43e002abc201d5b3b81e6a19e330ad863e8391b"},
    {"examples/models/R72/1608a.rcmodel", 0x1608, "7d9bf1503bd5a43e22bee26ef1db71eb1a95b4ce"},
    {"examples/models/R72/1608b.rcmodel", 0x1608, "39487a168437bfd12cfa6df8382d64c1019f80b7"},
    {"examples/models/T604/1886.rcmodel", 0x1886, "9ef753e1d66f8cf2ffaa7706f5f3453c27d37788"},
    {"examples/models/T618e/2168.rcmodel", 0x2168, "1b50f4236af0c0adec44bb492118b90940445413"},
    {"examples/device/Library/KVR/BatteryModels/T618e/2168.rcmodel", 0x2168,
     "1b50f4236af0c0adec44bb492118b90940445413"},
};

TEST(ExampleModels, EncodeAgainToTheirFileAndGiveRecordsOfTheirFixedDigests) {
  test::TestDevice device;
  auto handler = BatteryModelDataHandler::init();
  for (const auto& [name, chemID, recordSHA1] : kExamples) {
    SCOPED_TRACE(name);
    NSError error;
    auto file = PBStreamReader::readFile(std::string(KOLVRAND_SOURCE_DIR) + "/" + name, &error);
    ASSERT_TRUE(file) << error.description();
    auto models = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(*file, &error);
    ASSERT_TRUE(models && models->size() == 1) << error.description();
    EXPECT_EQ(models->front()->chemID(), chemID);
    EXPECT_EQ(
        PBStreamWriter::dataForMessages(std::span<const std::shared_ptr<OTAParamRC>>(*models)),
        *file);
    auto record = handler->createKextModelFromProtobufModel(models->front().get());
    ASSERT_TRUE(record);
    const auto* bytes = reinterpret_cast<const uint8_t*>(record.get());
    // The chem ID leads the record, least significant byte first.
    EXPECT_EQ(bytes[0], chemID & 0xff);
    EXPECT_EQ(bytes[1], chemID >> 8);
    const SHA1Digest digest = sha1(bytes, kKextBatteryModelSize);
    EXPECT_EQ(hexString(digest.data(), digest.size()), recordSHA1);
  }
}

}  // namespace
}  // namespace kolvrand
