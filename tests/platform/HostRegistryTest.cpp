// SPDX-License-Identifier: MIT
// The host backend against a umockdev testbed that plays the kernel: sysfs
// devices with the drivers' attribute files, and the power-management
// driver's node answering the structure-method ioctl. The test starts itself
// again with umockdev's preload library, which redirects /sys and /dev into
// the testbed.
#include <gtest/gtest.h>
#include <linux/tesvar_kvr.h>
#include <umockdev.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <mutex>

#include "base/CommonCrypto.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;

// What the fake driver was called with, and what it answers.
struct Driver {
  std::mutex mutex;
  int refuseWith = 0;  // errno of a refused call; 0 accepts
  int calls = 0;
  uint32_t selector = 0;
  std::string input;
};

gboolean handleIoctl(UMockdevIoctlBase*, UMockdevIoctlClient* client, gpointer data) {
  auto* driver = static_cast<Driver*>(data);
  if (umockdev_ioctl_client_get_request(client) != TESVAR_KVR_IOC_CALL_STRUCT) {
    umockdev_ioctl_client_complete(client, -1, ENOTTY);
    return TRUE;
  }
  UMockdevIoctlData* arg = umockdev_ioctl_client_get_arg(client);
  UMockdevIoctlData* callData =
      umockdev_ioctl_data_resolve(arg, 0, sizeof(tesvar_kvr_call), nullptr);
  tesvar_kvr_call call{};
  std::memcpy(&call, callData->data, sizeof call);
  UMockdevIoctlData* input = umockdev_ioctl_data_resolve(callData, offsetof(tesvar_kvr_call, input),
                                                         call.input_size, nullptr);
  std::lock_guard lock(driver->mutex);
  ++driver->calls;
  driver->selector = call.selector;
  driver->input.assign(reinterpret_cast<const char*>(input->data), call.input_size);
  umockdev_ioctl_client_complete(client, driver->refuseWith ? -1 : 0, driver->refuseWith);
  return TRUE;
}

// A testbed for one case; gone with its files when the case ends.
class Testbed {
 public:
  Testbed() : bed_(umockdev_testbed_new()), root_(umockdev_testbed_get_root_dir(bed_)) {}
  ~Testbed() {
    if (ioctl_) g_object_unref(ioctl_);
    g_object_unref(bed_);
  }
  Testbed(const Testbed&) = delete;
  Testbed& operator=(const Testbed&) = delete;

  // A platform device bound to `driver`, and `child` below it in
  // `subsystem`; a misc device has its node's numbers and name as the kernel
  // gives them in uevent, and its node in /dev when `node` says so.
  std::string add(const char* driver, const char* subsystem, const char* child,
                  const char* property = nullptr, bool node = false) {
    const std::string parent = device("platform", driver, nullptr, {}, {});
    fs::create_directories(root_ / "sys/bus/platform/drivers" / driver);
    fs::create_directory_symlink(fs::path("../../bus/platform/drivers") / driver,
                                 root_ / fs::path(parent).relative_path() / "driver");
    const bool misc = std::strcmp(subsystem, "misc") == 0;
    std::vector<const char*> attributes, properties;
    if (misc) {
      attributes = {"dev", "10:120\n"};
      properties = {"MAJOR", "10", "MINOR", "120", "DEVNAME", child};
    }
    if (property) properties.insert(properties.end(), {"KOLVRAND_SERVICE", property});
    const std::string path = device(subsystem, child, parent.c_str(), attributes, properties);
    if (node) {
      fs::create_directories(root_ / "dev");
      std::ofstream(root_ / "dev" / child);
    }
    return path;
  }

  // A device beside `sibling`, below the same parent, in `subsystem`.
  std::string addBeside(const std::string& sibling, const char* subsystem, const char* name) {
    return device(subsystem, name, fs::path(sibling).parent_path().c_str(), {}, {});
  }

  void attribute(const std::string& device, const char* name, const std::string& value) {
    fs::path file = root_ / fs::path(device).relative_path() / name;
    fs::create_directories(file.parent_path());
    std::ofstream(file) << value;
  }

  void attachDriver(const char* node, Driver* driver) {
    ioctl_ = umockdev_ioctl_base_new();
    g_signal_connect(ioctl_, "handle-ioctl", G_CALLBACK(handleIoctl), driver);
    ASSERT_TRUE(umockdev_testbed_attach_ioctl(bed_, node, ioctl_, nullptr));
  }

 private:
  std::string device(const char* subsystem, const char* name, const char* parent,
                     std::vector<const char*> attributes, std::vector<const char*> properties) {
    attributes.push_back(nullptr);
    properties.push_back(nullptr);
    gchar* path = umockdev_testbed_add_devicev(bed_, subsystem, name, parent,
                                               const_cast<gchar**>(attributes.data()),
                                               const_cast<gchar**>(properties.data()));
    std::string out = path;
    g_free(path);
    return out;
  }

  UMockdevTestbed* bed_;
  fs::path root_;
  UMockdevIoctlBase* ioctl_ = nullptr;
};

enum class Hash { Published, Short, Long, NotHex, Empty, NoFile, NoGroup };

struct Case {
  const char* name;
  // The battery: which driver registers it (nullptr: no battery), whether a
  // udev property names it, and its two files (nullptr: no such file).
  const char* batteryDriver;
  bool batteryByProperty;
  const char* chemID;
  const char* serial;
  // The power-management driver: its name (nullptr: none), whether its node
  // exists, the errno it refuses the call with, and what it publishes.
  const char* kvrDriver;
  bool node;
  int refuseWith;
  Hash hash;
  // Expected.
  uint32_t chem;
  const char* suffix;
  bool uploaded;
  Lines lines;
};

const char* const kSerial8 = "F5D2470A1B2C3D48\n";  // '8' at index 15
const std::string kGet = "error [batteryModelDataHandling] -[BatteryModelDataHandler ";
const std::string kIntRead = kGet + "getIntValueForKeyFromBatteryData:] <Error> ";
const std::string kSuffix = kGet + "getSpecialCaseBatteryModelIdentifier:] <Error> ";
const std::string kSet = kGet + "setBatteryModelDataToKernel:] <Error> ";
const std::string kVerify = kGet + "verifyHashData:] <Error> ";
const std::string kCall =
    kSet +
    "IOConnectCallStructMethod fail to call IOUserClient setBatteryParams,  ioReturnResult = ";
const char* const kBat = "TesvarSmartBattery";
const char* const kKvr = "TesvarKVR";

// One row a case, as the table is read.
// clang-format off
const Case kCases[] = {
    {"both found by their drivers", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::Published, 5640, "b", true, {}},
    {"both named by udev properties", "acme-fg", true, "5640\n", "SHORT\n", "acme-pm", true, 0, Hash::Published, 5640, "a", true, {}},
    {"6439 read as 8552", kBat, false, "6439\n", kSerial8, kKvr, true, 0, Hash::Published, 8552, "", true, {}},
    {"negative chem ID keeps its bits", kBat, false, "-1\n", kSerial8, kKvr, true, 0, Hash::Published, 0xffffffff, "", true, {}},
    {"no battery, no driver", nullptr, false, nullptr, nullptr, nullptr, false, 0, Hash::NoGroup, 0, "", false,
        {kIntRead + "powerService null", kSet + "no io service get matched"}},
    {"another driver's battery is not ours", "acme-fg", false, "5640\n", kSerial8, kKvr, true, 0, Hash::Published, 0, "", true,
        {kIntRead + "powerService null"}},
    {"chem ID not a number", kBat, false, "0x1608\n", kSerial8, kKvr, true, 0, Hash::Published, 0, "", true,
        {kIntRead + "valueCF null"}},
    {"chem ID beyond 32 bits", kBat, false, "4294967296\n", kSerial8, kKvr, true, 0, Hash::Published, 0, "", true,
        {kIntRead + "valueCF null"}},
    {"no chem ID file", kBat, false, nullptr, kSerial8, kKvr, true, 0, Hash::Published, 0, "", true,
        {kIntRead + "valueCF null"}},
    {"no serial number", kBat, false, "5640\n", nullptr, kKvr, true, 0, Hash::Published, 5640, "", true,
        {kSuffix + "valueCF null"}},
    {"node missing", kBat, false, "5640\n", kSerial8, kKvr, false, 0, Hash::Published, 5640, "b", false,
        {kSet + "IOServiceOpen fail to connect, ioReturnResult = -536870208"}},
    {"wrong size", kBat, false, "5640\n", kSerial8, kKvr, true, EINVAL, Hash::Published, 5640, "b", false,
        {kCall + "-536870206"}},
    {"unknown selector", kBat, false, "5640\n", kSerial8, kKvr, true, EOPNOTSUPP, Hash::Published, 5640, "b", false,
        {kCall + "-536870201"}},
    {"not permitted", kBat, false, "5640\n", kSerial8, kKvr, true, EPERM, Hash::Published, 5640, "b", false,
        {kCall + "-536870207"}},
    {"busy", kBat, false, "5640\n", kSerial8, kKvr, true, EBUSY, Hash::Published, 5640, "b", false,
        {kCall + "-536870187"}},
    {"short hash", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::Short, 5640, "b", false,
        {kVerify + "sentHash ef mismatches with returnedHash ef", kSet + "hash verify failed"}},
    {"long hash", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::Long, 5640, "b", false,
        {kVerify + "sentHash ef mismatches with returnedHash ef", kSet + "hash verify failed"}},
    {"hash not hex", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::NotHex, 5640, "b", false,
        {kVerify + "RCParamsHash nil", kSet + "hash verify failed"}},
    {"hash empty", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::Empty, 5640, "b", false,
        {kVerify + "RCParamsHash nil", kSet + "hash verify failed"}},
    {"hash not published", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::NoFile, 5640, "b", false,
        {kVerify + "RCParamsHash nil", kSet + "hash verify failed"}},
    {"no battery_model group", kBat, false, "5640\n", kSerial8, kKvr, true, 0, Hash::NoGroup, 5640, "b", false,
        {kVerify + "battModelDict nil", kSet + "hash verify failed"}},
};
// clang-format on

TEST(HostRegistry, DriversThroughSysfsAndTheNode) {
  // A record of zeros; its SHA-1 begins with 0xef.
  const auto record = std::make_unique<KextBatteryModel>();
  const SHA1Digest digest = sha1(record.get(), sizeof *record);
  const std::string hex = hexString(digest.data(), digest.size());
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    Testbed bed;
    Driver driver;
    driver.refuseWith = c.refuseWith;
    if (c.batteryDriver) {
      const std::string battery = bed.add(c.batteryDriver, "power_supply", "BAT0",
                                          c.batteryByProperty ? "TesvarSmartBattery" : nullptr);
      bed.attribute(battery, "type", "Battery\n");
      // The mains supply the driver registers too comes first in sysfs order
      // and is no battery.
      bed.attribute(bed.addBeside(battery, "power_supply", "AC"), "type", "Mains\n");
      if (c.chemID) bed.attribute(battery, "algo_chem_id", c.chemID);
      if (c.serial) bed.attribute(battery, "serial_number", c.serial);
    }
    if (c.kvrDriver) {
      const bool byProperty = std::strcmp(c.kvrDriver, "TesvarKVR") != 0;
      const std::string kvr =
          bed.add(c.kvrDriver, "misc", "tesvar_kvr", byProperty ? "TesvarKVR" : nullptr, c.node);
      const std::map<Hash, std::string> text = {
          {Hash::Published, hex + "\n"}, {Hash::Short, hex.substr(0, 38) + "\n"},
          {Hash::Long, hex + "00\n"},    {Hash::NotHex, "not a hash\n"},
          {Hash::Empty, "\n"},
      };
      if (auto it = text.find(c.hash); it != text.end())
        bed.attribute(kvr, "battery_model/rc_params_hash", it->second);
      else if (c.hash == Hash::NoFile)
        bed.attribute(kvr, "battery_model/uploads", "0\n");
      if (c.node) bed.attachDriver("/dev/tesvar_kvr", &driver);
    }

    auto capture = std::make_shared<test::LogCapture>();
    setLogSink(capture);
    platform::setBackend(platform::makeHostBackend());
    BatteryModelDataHandler handler;
    handler.setLog(os_log_create("com.tesvar.kolvrand", "batteryModelDataHandling"));
    const uint32_t chem = handler.getBatteryChemID();
    EXPECT_EQ(chem, c.chem);
    EXPECT_EQ(handler.getSpecialCaseBatteryModelIdentifier(chem), c.suffix);
    EXPECT_EQ(handler.setBatteryModelDataToKernel(record.get()), c.uploaded);
    EXPECT_EQ(capture->lines(), c.lines);
    platform::setBackend(nullptr);
    setLogSink(nullptr);

    // The record reaches the driver whole, by selector 24, once; nothing
    // reaches it when the node cannot be opened.
    std::lock_guard lock(driver.mutex);
    EXPECT_EQ(driver.calls, c.kvrDriver && c.node ? 1 : 0);
    if (driver.calls) {
      EXPECT_EQ(driver.selector, 24u);
      EXPECT_TRUE(driver.input ==
                  std::string(reinterpret_cast<const char*>(record.get()), sizeof *record));
    }
  }
}

}  // namespace
}  // namespace kolvrand

int main(int argc, char** argv) {
  const char* preload = std::getenv("LD_PRELOAD");
  if (!preload || !std::strstr(preload, "libumockdev-preload")) {
    setenv("LD_PRELOAD", "libumockdev-preload.so.0", 1);
    // AddressSanitizer then accepts a library loaded before its own, and
    // leaves GLib's allocations for the process's life alone.
    setenv("ASAN_OPTIONS", "verify_asan_link_order=0:detect_leaks=0", 1);
    execv("/proc/self/exe", argv);
    std::perror("host_registry_test: cannot start again with umockdev");
    return 1;
  }
  testing::InitGoogleTest(&argc, argv);
  return RUN_ALL_TESTS();
}
