// The simulated device, and the kernel-variable, registry, driver and hashing
// operations that read it.
#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>

#include "platform/CommonCrypto.h"
#include "platform/IOKit.h"
#include "platform/Sysctl.h"
#include "tests/platform/TestUtil.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;

std::optional<std::string> readSysctl(const char* name) {
  size_t len = 0;
  if (sysctlbyname(name, nullptr, &len, nullptr, 0) != 0) return std::nullopt;
  std::string buf(len, '\0');
  if (sysctlbyname(name, buf.data(), &len, nullptr, 0) != 0) return std::nullopt;
  buf.resize(len);
  return buf;
}

io_service_t service(const char* name) {
  return IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching(name));
}

// A device from raw device.json text (none at all for nullptr).
struct RawDevice : test::TestDevice {
  explicit RawDevice(const char* text) {
    fs::remove(dir() / "device.json");
    if (text) test::writeFile(dir() / "device.json", text);
    reload();
  }
};

TEST(SimulatedDevice, KernelVariablesAndRegistryAreServedAsGiven) {
  RawDevice device(
      R"({"sysctl": {"kern.bootsessionuuid": "0f1e-boot", "hw.targettype": {"$data": "ff00FE"}},
    "registry": {"TesvarKVR": {}, "TesvarSmartBattery": {"BatteryData": {"Z": 1, "Big": 18446744073709551615,
      "F": 0.5, "On": true, "List": [1, "two"], "Raw": {"$data": "0aFF"}, "NotData": {"$data": "00", "x": 1}}}}})");
  // The two-call protocol: the length first (with its NUL), then the bytes.
  EXPECT_EQ(readSysctl("kern.bootsessionuuid"), std::string("0f1e-boot\0", 10));
  EXPECT_EQ(readSysctl("hw.targettype"), std::string("\xff\x00\xfe", 3));
  const struct {
    const char* name;
    size_t bufferSize;
    bool queryOnly, withNewValue, withLength;
    int error;
  } failures[] = {
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
              -1);
    EXPECT_EQ(errno, c.error) << c.name << " " << c.bufferSize;
  }

  io_service_t battery = service("TesvarSmartBattery");
  ASSERT_NE(battery, 0u);
  EXPECT_FALSE(IORegistryEntryCreateCFProperty(battery, "NoSuchProperty"));
  auto data = IORegistryEntryCreateCFProperty(battery, "BatteryData");
  const auto n = [](int64_t v) { return Value(Number::fromSigned(v)); };
  EXPECT_EQ(data, Value(Dictionary{
                      {"Z", n(1)},
                      {"Big", Value(Number::fromUnsigned(UINT64_MAX))},
                      {"F", Value(Number::fromDouble(0.5))},
                      {"On", Value(true)},
                      {"List", Value(Array{n(1), Value("two")})},
                      {"Raw", Value(Data{0x0a, 0xff})},
                      {"NotData", Value(Dictionary{{"$data", Value("00")}, {"x", n(1)}})},
                  }));
  EXPECT_EQ(data->asDictionary()->begin()->first, "Z");  // the file's order is kept
}

// Whatever is wrong with device.json, the device comes up empty and says why
// once; a bad part anywhere drops the good sections too.
TEST(SimulatedDevice, BadDeviceFilesGiveAnEmptyDevice) {
  const auto nested = [](int depth) {
    return R"({"sysctl": {"kern.bootsessionuuid": "1"}, "registry": {"TesvarKVR": {"P": )" +
           std::string(depth, '[') + std::string(depth, ']') + "}}}";
  };
  const std::string bad[] = {
      "",
      "{",
      "[]",
      R"({"sysctl": []})",
      R"({"sysctl": {"kern.bootsessionuuid": 5}})",
      R"({"sysctl": {"kern.bootsessionuuid": {"$data": "abc"}}})",
      R"({"sysctl": {"kern.bootsessionuuid": {"$data": "zz"}}})",
      "{\"sysctl\": {\"kern.bootsessionuuid\": \"\xff\xfe\"}}",
      R"({"sysctl": {"kern.bootsessionuuid": "1111)",
      R"({"sysctl": {"kern.bootsessionuuid": ")" + std::string(4 << 20, 'x') + "\", 1}}",
      R"({"registry": {"TesvarSmartBattery": 1}})",
      R"({"registry": {"TesvarSmartBattery": {"BatteryData": {"AlgoChemID": null}}}})",
      R"({"sysctl": {"kern.bootsessionuuid": "b"}, "registry": {"TesvarKVR": 3}})",
      R"({"driver": {"openResult": "0"}})",
      R"({"driver": {"openResult": 1.5}})",
      R"({"driver": {"setBatteryParamsResult": 1099511627776}})",
      nested(65),
      nested(200000),
  };
  const auto check = [](const test::TestDevice& device, const std::string& label) {
    const auto lines = device.logLines();
    EXPECT_EQ(std::count_if(lines.begin(), lines.end(),
                            [](const std::string& l) { return l.starts_with("error [device]"); }),
              1)
        << label << testing::PrintToString(lines);
    EXPECT_EQ(service("TesvarKVR"), 0u) << label;
    EXPECT_FALSE(readSysctl("kern.bootsessionuuid")) << label;
  };
  for (const std::string& text : bad) check(RawDevice(text.c_str()), text.substr(0, 80));
  check(RawDevice(nullptr), "(none)");
  RawDevice directory(nullptr);
  fs::create_directory(directory.dir() / "device.json");
  directory.clearLog();
  directory.reload();
  check(directory, "a directory");
  // Nesting just within the bound loads.
  RawDevice deepest(nested(64).c_str());
  EXPECT_TRUE(readSysctl("kern.bootsessionuuid"));
}

constexpr size_t kRecordSize = 29056;

std::vector<uint8_t> record(uint8_t seed) {
  std::vector<uint8_t> r(kRecordSize);
  for (size_t i = 0; i < r.size(); ++i) r[i] = static_cast<uint8_t>(i * 31 + seed);
  return r;
}

io_connect_t open() {
  io_connect_t c = 0;
  EXPECT_EQ(IOServiceOpen(service("TesvarKVR"), mach_task_self(), 0, &c), kIOReturnSuccess);
  return c;
}
kern_return_t send(io_connect_t c, const std::vector<uint8_t>& r, uint32_t selector = 24) {
  return IOConnectCallStructMethod(c, selector, r.data(), r.size(), nullptr, nullptr);
}
std::optional<Value> published() {
  return IORegistryEntryCreateCFProperty(service("TesvarKVR"), "KVRVector");
}
Value hashProperty(const std::vector<uint8_t>& r) {
  const SHA1Digest d = sha1(r.data(), r.size());
  return Value(
      Dictionary{{"KVRBatteryModel", Dictionary{{"RCParamsHash", Data(d.begin(), d.end())}}}});
}

TEST(SimulatedDriver, KeepsOnlyTheRecordAndPublishesItsHash) {
  test::TestDevice device;
  const fs::path kept = device.dir() / "driver" / "battery_params.bin";
  io_connect_t c = open();
  ASSERT_NE(c, 0u);
  const std::pair<uint32_t, size_t> refused[] = {
      {24, kRecordSize - 1}, {24, kRecordSize + 1}, {24, 0}, {23, kRecordSize}};
  for (const auto& [selector, size] : refused)
    EXPECT_EQ(send(c, std::vector<uint8_t>(size, 1), selector), kIOReturnBadArgument) << size;
  auto r = record(7);
  size_t outSize = 4;
  uint8_t out[4];
  EXPECT_EQ(IOConnectCallStructMethod(c, 24, r.data(), r.size(), out, &outSize),
            kIOReturnUnsupported);
  EXPECT_FALSE(fs::exists(kept));
  EXPECT_FALSE(published());

  ASSERT_EQ(send(c, r), kIOReturnSuccess);
  EXPECT_EQ(test::readFileText(kept), std::string(r.begin(), r.end()));
  EXPECT_EQ(published(), hashProperty(r));
  // Closed (and never opened) connections are refused; closing twice is harmless.
  IOServiceClose(c);
  IOServiceClose(c);
  IOServiceClose(12345);
  EXPECT_EQ(send(c, r), kIOReturnNotOpen);
  // The kept record outlives the daemon: a new start still publishes its hash.
  device.reload();
  EXPECT_EQ(published(), hashProperty(r));
  ASSERT_EQ(send(open(), record(9)), kIOReturnSuccess);
  EXPECT_EQ(published(), hashProperty(record(9)));

  // A KVRVector in device.json is published as given, whatever is sent;
  // null publishes none.
  const auto load = [&](nlohmann::json kvr, nlohmann::json driver = nlohmann::json::object()) {
    device.writeDeviceJSON({{"registry", {{"TesvarKVR", kvr}}}, {"driver", driver}});
    device.reload();
  };
  load({{"KVRVector", {{"KVRBatteryModel", {{"RCParamsHash", {{"$data", "0102"}}}}}}}});
  const Value given(Dictionary{{"KVRBatteryModel", Dictionary{{"RCParamsHash", Data{1, 2}}}}});
  ASSERT_EQ(send(open(), record(3)), kIOReturnSuccess);
  EXPECT_EQ(published(), given);
  load({{"KVRVector", nullptr}});
  EXPECT_FALSE(published());

  // The configured failures: no connection, or the record refused and not kept.
  fs::remove(kept);
  load(nlohmann::json::object(), {{"openResult", 3758097084u}});
  c = 77;
  EXPECT_EQ(IOServiceOpen(service("TesvarKVR"), mach_task_self(), 0, &c), kIOReturnError);
  EXPECT_EQ(c, 0u);
  load(nlohmann::json::object(), {{"setBatteryParamsResult", -536870212}});
  EXPECT_EQ(send(open(), record(1)), kIOReturnError);
  EXPECT_FALSE(fs::exists(kept));
  EXPECT_FALSE(published());
}

TEST(HostBackend, BootSessionIsTheKernelBootIdAndThereIsNoDriver) {
  platform::setBackend(platform::makeHostBackend());
  std::string bootId = test::readFileText("/proc/sys/kernel/random/boot_id");
  if (!bootId.empty()) {
    EXPECT_EQ(readSysctl("kern.bootsessionuuid"), bootId.substr(0, bootId.size() - 1) + '\0');
  }
  EXPECT_FALSE(readSysctl("kern.nosuchvariable"));
  EXPECT_EQ(service("TesvarKVR"), 0u);
  platform::setBackend(nullptr);
}

TEST(SHA1, MatchesTheStandardVectors) {
  for (const auto& [input, digest] :
       {std::pair<std::string, const char*>{"abc", "a9993e364706816aba3e25717850c26c9cd0d89d"},
        {std::string(1000000, 'a'), "34aa973cd4c4daa4f61eeb2bdbad27316534016f"}}) {
    const SHA1Digest d = sha1(input.data(), input.size());
    EXPECT_EQ(hexString(d.data(), d.size()), digest);
  }
}

}  // namespace
}  // namespace kolvrand
