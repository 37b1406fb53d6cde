// SPDX-License-Identifier: MIT
// The simulated device; the kernel-variable, registry, driver and hashing
// operations that read it; and the defaults kept in its state directory.
#include <gtest/gtest.h>

#include <cerrno>
#include <sstream>

#include "base/CommonCrypto.h"
#include "platform/Defaults.h"
#include "platform/IOKit.h"
#include "platform/Sysctl.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;

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
  const auto error = [](int result) { return result == -1 ? errno : 0; };
  char out[16];
  size_t n = 9;  // one short
  EXPECT_EQ(error(sysctlbyname("kern.bootsessionuuid", out, &n, nullptr, 0)), ENOMEM);
  EXPECT_EQ(error(sysctlbyname("kern.nosuchvariable", nullptr, &n, nullptr, 0)), ENOENT);
  EXPECT_EQ(error(sysctlbyname(nullptr, nullptr, &n, nullptr, 0)), ENOENT);
  EXPECT_EQ(error(sysctlbyname("kern.bootsessionuuid", nullptr, &n, "x", 1)), EPERM);
  EXPECT_EQ(error(sysctlbyname("kern.bootsessionuuid", out, nullptr, nullptr, 0)), EINVAL);

  io_service_t battery = service("TesvarSmartBattery");
  ASSERT_NE(battery, 0u);
  EXPECT_EQ(service(""), 0u);
  EXPECT_FALSE(IORegistryEntryCreateCFProperty(battery, "NoSuchProperty"));
  EXPECT_FALSE(IORegistryEntryCreateCFProperty(0, "BatteryData"));
  auto data = IORegistryEntryCreateCFProperty(battery, "BatteryData");
  const auto i = [](int64_t v) { return Value(Number::fromSigned(v)); };
  EXPECT_EQ(data, Value(Dictionary{
                      {"Z", i(1)},
                      {"Big", Value(Number::fromUnsigned(UINT64_MAX))},
                      {"F", Value(Number::fromFloat(0.5f))},
                      {"On", Value(true)},
                      {"List", Value(Array{i(1), Value("two")})},
                      {"Raw", Value(Data{0x0a, 0xff})},
                      {"NotData", Value(Dictionary{{"$data", Value("00")}, {"x", i(1)}})},
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
  // Each line of bad_devices.txt is one device.json; then an empty one,
  // nestings past the bound, and 4 MiB that break off.
  std::vector<std::string> bad;
  std::istringstream lines(test::readFile(KOLVRAND_SOURCE_DIR "/tests/platform/bad_devices.txt"));
  for (std::string line; std::getline(lines, line);) bad.push_back(line);
  bad.insert(bad.end(),
             {"", nested(65), nested(200000),
              R"({"sysctl": {"kern.bootsessionuuid": ")" + std::string(4 << 20, 'x') + "\", 1}}"});

  const auto check = [](const test::TestDevice& device, const std::string& label) {
    const auto lines = device.logLines();
    EXPECT_TRUE(lines.size() == 1 && lines[0].starts_with("error [device] simulated device "))
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

// Which driver calls are refused, what an accepted record leaves, and the
// configured and real failures. (The results the daemon meets, and a
// KVRVector given in device.json, are crossed by the transfer tests.)
TEST(SimulatedDriver, KeepsOnlyTheRecordAndPublishesItsHash) {
  test::TestDevice device;
  const fs::path kept = device.dir() / "driver" / "battery_params.bin";
  const io_service_t kvr = service("TesvarKVR"), battery = service("TesvarSmartBattery");
  io_connect_t c = 0;
  EXPECT_EQ(IOServiceOpen(battery, mach_task_self(), 0, &c), kIOReturnUnsupported);
  EXPECT_EQ(IOServiceOpen(kvr, mach_task_self(), 1, &c), kIOReturnBadArgument);
  EXPECT_EQ(IOServiceOpen(0, mach_task_self(), 0, &c), kIOReturnBadArgument);
  EXPECT_EQ(IOServiceOpen(kvr, mach_task_self(), 0, nullptr), kIOReturnBadArgument);
  ASSERT_EQ(IOServiceOpen(kvr, mach_task_self(), 0, &c), kIOReturnSuccess);
  std::vector<uint8_t> r(29056);
  for (size_t i = 0; i < r.size(); ++i) r[i] = static_cast<uint8_t>(i * 31 + 7);
  const auto send = [&](io_connect_t c, size_t size, uint32_t selector = 24) {
    return IOConnectCallStructMethod(c, selector, r.data(), size, nullptr, nullptr);
  };
  // Only selector 24, with a record of exactly its size and no output.
  for (const auto& [selector, size] :
       {std::pair<uint32_t, size_t>{24, r.size() - 1}, {24, r.size() + 1}, {24, 0}, {23, r.size()}})
    EXPECT_EQ(send(c, size, selector), kIOReturnBadArgument) << size;
  size_t outSize = 4;
  EXPECT_EQ(IOConnectCallStructMethod(c, 24, r.data(), r.size(), nullptr, &outSize),
            kIOReturnUnsupported);
  EXPECT_EQ(IOConnectCallStructMethod(c, 24, nullptr, 1, nullptr, nullptr), kIOReturnBadArgument);
  EXPECT_EQ(send(0, r.size()), kIOReturnNotOpen);
  EXPECT_FALSE(fs::exists(kept) || IORegistryEntryCreateCFProperty(kvr, "KVRVector"));

  ASSERT_EQ(send(c, r.size()), kIOReturnSuccess);
  EXPECT_EQ(test::readFile(kept), std::string(r.begin(), r.end()));
  const SHA1Digest d = sha1(r.data(), r.size());
  const Value hash(
      Dictionary{{"KVRBatteryModel", Dictionary{{"RCParamsHash", Data(d.begin(), d.end())}}}});
  EXPECT_EQ(IORegistryEntryCreateCFProperty(kvr, "KVRVector"), hash);
  // Closed (and never opened) connections are refused; closing twice is harmless.
  EXPECT_EQ(IOServiceClose(c), kIOReturnSuccess);
  EXPECT_EQ(IOServiceClose(c), kIOReturnSuccess);
  EXPECT_EQ(IOServiceClose(0), kIOReturnNotOpen);
  EXPECT_EQ(send(c, r.size()), kIOReturnNotOpen);
  // The kept record outlives the daemon: a new start still publishes its hash.
  device.reload();
  EXPECT_EQ(IORegistryEntryCreateCFProperty(kvr, "KVRVector"), hash);
  // A record that cannot be kept is refused.
  fs::remove_all(kept.parent_path());
  test::writeFile(kept.parent_path(), "");
  ASSERT_EQ(IOServiceOpen(kvr, mach_task_self(), 0, &c), kIOReturnSuccess);
  EXPECT_EQ(send(c, r.size()), kIOReturnError);
  // A refused connection, its code given in the unsigned form.
  device.writeDeviceJSON(
      {{"registry", {{"TesvarKVR", json::object()}}}, {"driver", {{"openResult", 3758097084u}}}});
  device.reload();
  EXPECT_EQ(IOServiceOpen(kvr, mach_task_self(), 0, &c), kIOReturnError);
  EXPECT_EQ(c, 0u);
}

constexpr const char* kSuite = "com.tesvar.kolvrand";

TEST(Defaults, ReadEachTypeOnlyAsItselfSeeWritesMadeElsewhereAndFailWithoutADirectory) {
  test::TestDevice device;
  const fs::path dir = device.dir() / "state";
  auto d = NSUserDefaults::initWithSuiteName(kSuite);  // the device's state directory
  auto same = NSUserDefaults::initWithSuiteName(kSuite, dir / "." / "");
  ASSERT_TRUE(d && same && d->setObject("C5B4-11", "s") && d->setInteger(INT64_MIN, "min") &&
              d->setBool(true, "b"));
  test::writeFile(dir / "other.json", R"({"big": 18446744073709551615, "f": 1.5, "n": null})");
  auto other = NSUserDefaults::initWithSuiteName("other", dir);
  std::string read;  // each key as a string and as a bool
  for (const auto& [defaults, key] : {std::pair{same, "s"},
                                      {same, "min"},
                                      {same, "b"},
                                      {d, "absent"},
                                      {other, "big"},
                                      {other, "f"},
                                      {other, "n"}})
    read += std::string(key) + "=" + defaults->stringForKey(key).value_or("nil") + "/" +
            (defaults->boolForKey(key) ? "true " : "false ");
  EXPECT_EQ(read,
            "s=C5B4-11/false min=nil/false b=nil/true absent=nil/false big=nil/false f=nil/false "
            "n=nil/false ");
  EXPECT_EQ(json::parse(test::readFile(d->path())),
            json({{"s", "C5B4-11"}, {"min", INT64_MIN}, {"b", true}}));
  // Another process replacing the file is seen at the next read.
  test::writeFile(d->path(), R"({"s": "two"})");
  EXPECT_EQ(same->stringForKey("s"), "two");

  // No directory where a file is, and names that are no file names.
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName(kSuite, device.dir() / "device.json" / "state"));
  for (const char* name : {"", ".", "..", "a/b"})
    EXPECT_FALSE(NSUserDefaults::initWithSuiteName(name, dir) ||
                 NSUserDefaults::openExistingSuiteNamed(name, dir))
        << name;
  // A missing directory, nested too, is created.
  auto nested = NSUserDefaults::initWithSuiteName(kSuite, dir / "a" / "b");
  EXPECT_TRUE(nested && nested->setInteger(1, "k"));
  // A lock that cannot be taken, or a suite file that is a directory: nothing
  // is written, and the latter reads as empty.
  fs::create_directories(dir / "locked.json.lock");
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName("locked", dir)->setBool(true, "k"));
  fs::create_directories(dir / "folder.json");
  auto folder = NSUserDefaults::initWithSuiteName("folder", dir);
  EXPECT_FALSE(folder->setBool(true, "k") || folder->boolForKey("k"));
}

}  // namespace
}  // namespace kolvrand
