// The simulated device, and the kernel-variable, registry, file and hashing
// operations that read it.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "platform/CommonCrypto.h"
#include "platform/Defaults.h"
#include "platform/FileManager.h"
#include "platform/IOKit.h"
#include "platform/Internal.h"
#include "platform/Sysctl.h"
#include "platform/ValueJSON.h"
#include "tests/platform/TestUtil.h"

namespace kolvrand {
namespace {

using test::DeviceFixture;

constexpr const char* kDevice = R"({
  "sysctl": {"kern.bootsessionuuid": "0f1e-boot", "hw.targettype": {"$data": "ff00FE"}},
  "registry": {
    "TesvarSmartBattery": {"BatteryData": {"AlgoChemID": 6439, "BatterySerialNumber": "F5D1234567890A8B"}},
    "TesvarKVR": {}
  }
})";

std::optional<std::string> readSysctl(const char* name) {
  size_t len = 0;
  if (sysctlbyname(name, nullptr, &len, nullptr, 0) != 0) return std::nullopt;
  std::string buf(len, '\0');
  if (sysctlbyname(name, buf.data(), &len, nullptr, 0) != 0) return std::nullopt;
  buf.resize(len);
  return buf;
}

using SimulatedDevice = DeviceFixture;

TEST_F(SimulatedDevice, KernelVariablesFollowTheTwoCallProtocol) {
  makeDevice(kDevice);
  size_t len = 0;
  ASSERT_EQ(sysctlbyname("kern.bootsessionuuid", nullptr, &len, nullptr, 0), 0);
  EXPECT_EQ(len, 10u);  // with its NUL
  char buf[16];
  std::memset(buf, 'x', sizeof buf);
  len = sizeof buf;
  ASSERT_EQ(sysctlbyname("kern.bootsessionuuid", buf, &len, nullptr, 0), 0);
  EXPECT_EQ(len, 10u);
  EXPECT_EQ(std::string(buf, len), std::string("0f1e-boot\0", 10));
  EXPECT_EQ(readSysctl("hw.targettype"), std::string("\xff\x00\xfe", 3));

  struct Case {
    const char* name;
    size_t bufferSize;
    bool queryOnly, withNewValue, withLength;
    int error;
  };
  const Case failures[] = {
      {"kern.nosuchvariable", 0, true, false, true, ENOENT},
      {"kern.bootsessionuuid", 9, false, false, true, ENOMEM},
      {"kern.bootsessionuuid", 16, false, true, true, EPERM},
      {"kern.bootsessionuuid", 16, false, false, false, EINVAL},
  };
  for (const auto& c : failures) {
    char out[16];
    size_t n = c.bufferSize;
    errno = 0;
    EXPECT_EQ(sysctlbyname(c.name, c.queryOnly ? nullptr : out, c.withLength ? &n : nullptr,
                           c.withNewValue ? "x" : nullptr, c.withNewValue ? 1 : 0),
              -1)
        << c.name;
    EXPECT_EQ(errno, c.error) << c.name << " " << c.bufferSize;
  }
}

TEST_F(SimulatedDevice, RegistryPublishesThePropertiesAsGiven) {
  makeDevice(R"({"registry": {"TesvarSmartBattery": {
      "BatteryData": {"Z": 1, "AlgoChemID": 6439, "Big": 18446744073709551615, "F": 0.5,
                      "On": true, "List": [1, "two"], "Raw": {"$data": "0aFF"},
                      "NotData": {"$data": "00", "x": 1}}}}})");
  io_service_t battery =
      IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching("TesvarSmartBattery"));
  ASSERT_NE(battery, 0u);
  EXPECT_EQ(IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching("TesvarKVR")), 0u);
  EXPECT_FALSE(IORegistryEntryCreateCFProperty(battery, "NoSuchProperty"));
  auto data = IORegistryEntryCreateCFProperty(battery, "BatteryData");
  ASSERT_TRUE(data && data->isDictionary());
  Dictionary expected{
      {"Z", Value(Number::fromSigned(1))},
      {"AlgoChemID", Value(Number::fromSigned(6439))},
      {"Big", Value(Number::fromUnsigned(UINT64_MAX))},
      {"F", Value(Number::fromDouble(0.5))},
      {"On", Value(true)},
      {"List", Value(Array{Value(Number::fromSigned(1)), Value("two")})},
      {"Raw", Value(Data{0x0a, 0xff})},
      {"NotData", Value(Dictionary{{"$data", Value("00")}, {"x", Value(Number::fromSigned(1))}})},
  };
  EXPECT_EQ(*data, Value(expected));
  // The order of device.json is kept.
  EXPECT_EQ(data->asDictionary()->begin()->first, "Z");
}

TEST_F(SimulatedDevice, BadDeviceFilesGiveAnEmptyDevice) {
  const char* bad[] = {
      nullptr,  // no device.json at all
      "{",
      "[]",
      R"({"sysctl": []})",
      R"({"sysctl": {"kern.bootsessionuuid": 5}})",
      R"({"sysctl": {"kern.bootsessionuuid": {"$data": "abc"}}})",
      R"({"sysctl": {"kern.bootsessionuuid": {"$data": "zz"}}})",
      R"({"registry": {"TesvarSmartBattery": 1}})",
      R"({"registry": {"TesvarSmartBattery": {"BatteryData": {"AlgoChemID": null}}}})",
      R"({"driver": {"openResult": "0"}})",
      R"({"driver": {"openResult": 1.5}})",
      R"({"driver": {"setBatteryParamsResult": 1099511627776}})",
  };
  for (const char* content : bad) {
    test::TempDir device;
    if (content) test::writeFile(device.path() / "device.json", content);
    std::string label = content ? content : "(none)";
    test::CapturedLog captured;
    platform::setBackend(platform::makeSimulatedDevice(device.path()));
    EXPECT_EQ(captured->count(LogLevel::Error, "device"), 1u) << label;
    EXPECT_EQ(IOServiceGetMatchingService(0, IOServiceMatching("TesvarSmartBattery")), 0u) << label;
    EXPECT_FALSE(readSysctl("kern.bootsessionuuid")) << label;
  }
  // A bad part elsewhere also drops the good sections.
  makeDevice(R"({"sysctl": {"kern.bootsessionuuid": "b"}, "registry": {"TesvarKVR": 3}})");
  EXPECT_FALSE(readSysctl("kern.bootsessionuuid"));
}

constexpr size_t kRecordSize = 29056;

std::vector<uint8_t> record(uint8_t seed) {
  std::vector<uint8_t> r(kRecordSize);
  for (size_t i = 0; i < r.size(); ++i) r[i] = static_cast<uint8_t>(i * 31 + seed);
  return r;
}

class SimulatedDriver : public DeviceFixture {
 protected:
  io_connect_t open() {
    io_service_t s = IOServiceGetMatchingService(0, IOServiceMatching("TesvarKVR"));
    EXPECT_NE(s, 0u);
    io_connect_t c = 0;
    EXPECT_EQ(IOServiceOpen(s, mach_task_self(), 0, &c), kIOReturnSuccess);
    return c;
  }
  kern_return_t send(io_connect_t c, const std::vector<uint8_t>& r, uint32_t selector = 24) {
    return IOConnectCallStructMethod(c, selector, r.data(), r.size(), nullptr, nullptr);
  }
  std::optional<Value> published() {
    return IORegistryEntryCreateCFProperty(
        IOServiceGetMatchingService(0, IOServiceMatching("TesvarKVR")), "KVRVector");
  }
  static Value hashProperty(const SHA1Digest& d) {
    return Value(
        Dictionary{{"KVRBatteryModel", Dictionary{{"RCParamsHash", Data(d.begin(), d.end())}}}});
  }
  std::filesystem::path kept() const { return dir.path() / "driver" / "battery_params.bin"; }
};

TEST_F(SimulatedDriver, AcceptsOnlyTheRecordOnSetBatteryParams) {
  makeDevice(kDevice);
  io_connect_t c = open();
  ASSERT_NE(c, 0u);
  struct Case {
    uint32_t selector;
    size_t size;
    kern_return_t expected;
  };
  const Case cases[] = {
      {24, kRecordSize - 1, kIOReturnBadArgument},
      {24, kRecordSize + 1, kIOReturnBadArgument},
      {24, 0, kIOReturnBadArgument},
      {23, kRecordSize, kIOReturnBadArgument},
  };
  for (const auto& k : cases) {
    std::vector<uint8_t> input(k.size, 1);
    EXPECT_EQ(send(c, input, k.selector), k.expected) << k.selector << " " << k.size;
  }
  EXPECT_FALSE(std::filesystem::exists(kept()));
  EXPECT_FALSE(published());

  auto r = record(7);
  size_t noOutput = 4;
  uint8_t out[4];
  EXPECT_EQ(IOConnectCallStructMethod(c, 24, r.data(), r.size(), out, &noOutput),
            kIOReturnUnsupported);
  ASSERT_EQ(send(c, r), kIOReturnSuccess);
  EXPECT_EQ(test::readFileText(kept()), std::string(r.begin(), r.end()));
  EXPECT_EQ(published(), hashProperty(sha1(r.data(), r.size())));

  // Closed (and never opened) connections are refused; closing twice is harmless.
  IOServiceClose(c);
  IOServiceClose(c);
  IOServiceClose(12345);
  EXPECT_EQ(send(c, r), kIOReturnNotOpen);

  // The kept record outlives the daemon: a new start still publishes its hash.
  platform::setBackend(platform::makeSimulatedDevice(dir.path()));
  EXPECT_EQ(published(), hashProperty(sha1(r.data(), r.size())));
  auto r2 = record(9);
  ASSERT_EQ(send(open(), r2), kIOReturnSuccess);
  EXPECT_EQ(published(), hashProperty(sha1(r2.data(), r2.size())));
}

TEST_F(SimulatedDriver, ReportsTheConfiguredFailures) {
  makeDevice(R"({"registry": {"TesvarKVR": {}}, "driver": {"openResult": 3758097084}})");
  io_service_t s = IOServiceGetMatchingService(0, IOServiceMatching("TesvarKVR"));
  io_connect_t c = 77;
  EXPECT_EQ(IOServiceOpen(s, mach_task_self(), 0, &c), kIOReturnError);
  EXPECT_EQ(c, 0u);

  makeDevice(
      R"({"registry": {"TesvarKVR": {}}, "driver": {"setBatteryParamsResult": -536870212}})");
  EXPECT_EQ(send(open(), record(1)), kIOReturnError);
  EXPECT_FALSE(std::filesystem::exists(kept()));
  EXPECT_FALSE(published());
}

TEST_F(SimulatedDriver, PublishesAKVRVectorFromDeviceJsonAsGiven) {
  makeDevice(
      R"({"registry": {"TesvarKVR": {"KVRVector": {"KVRBatteryModel": {"RCParamsHash": {"$data": "0102"}}}}}})");
  Value given(Dictionary{{"KVRBatteryModel", Dictionary{{"RCParamsHash", Data{1, 2}}}}});
  EXPECT_EQ(published(), given);
  ASSERT_EQ(send(open(), record(3)), kIOReturnSuccess);
  EXPECT_EQ(published(), given);

  // null: the driver publishes no KVRVector at all.
  makeDevice(R"({"registry": {"TesvarKVR": {"KVRVector": null}}})");
  EXPECT_FALSE(published());
  EXPECT_TRUE(std::filesystem::exists(kept()));
}

TEST(HostBackend, BootSessionIsTheKernelBootId) {
  platform::setBackend(platform::makeHostBackend());
  std::string bootId = test::readFileText("/proc/sys/kernel/random/boot_id");
  if (bootId.empty()) GTEST_SKIP() << "no boot_id on this system";
  EXPECT_EQ(readSysctl("kern.bootsessionuuid"), bootId.substr(0, bootId.size() - 1) + '\0');
  EXPECT_FALSE(readSysctl("kern.nosuchvariable"));
  EXPECT_EQ(IOServiceGetMatchingService(0, IOServiceMatching("TesvarKVR")), 0u);
  platform::setBackend(nullptr);
}

TEST(SHA1, MatchesTheStandardVectors) {
  const std::pair<std::string, const char*> cases[] = {
      {"abc", "a9993e364706816aba3e25717850c26c9cd0d89d"},
      {std::string(1000000, 'a'), "34aa973cd4c4daa4f61eeb2bdbad27316534016f"}};
  for (const auto& [input, digest] : cases) {
    SHA1Digest oneShot = sha1(input.data(), input.size());
    EXPECT_EQ(hexString(oneShot.data(), oneShot.size()), digest);
  }
}

}  // namespace
}  // namespace kolvrand
