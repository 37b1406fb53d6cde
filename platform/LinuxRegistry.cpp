// SPDX-License-Identifier: MIT
// The registry on Linux: driver services are devices in sysfs, their
// properties the devices' attribute files, and a user client the
// power-management driver's character device. The files and the node are
// described in kernel/Documentation/ABI/testing/sysfs-driver-tesvar.
//
// A service of class C is the first device whose KOLVRAND_SERVICE property
// (a udev rule's, or the driver's uevent variable) is C; failing that, the
// first device of the class's subsystem and kind whose parent is bound to a
// driver named C, which is how the reference drivers are found with no udev
// at all.
#include <fcntl.h>
#include <linux/tesvar_kvr.h>
#include <sys/ioctl.h>
#include <systemd/sd-device.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <vector>

#include "base/Hex.h"
#include "platform/Backend.h"
#include "platform/IOKit.h"
#include "platform/Internal.h"
#include "platform/LinuxRegistry.h"

namespace kolvrand::platform {

namespace {

using namespace kvr_driver;

static_assert(kSetBatteryParamsSelector == TESVAR_KVR_SET_BATTERY_PARAMS);
static_assert(kBatteryParamsSize == TESVAR_KVR_BATTERY_PARAMS_SIZE);

constexpr const char* kServiceProperty = "KOLVRAND_SERVICE";

// Where each class's devices live when no udev property names them, and
// the attribute that tells them from the driver's other devices there (a
// battery driver often registers the mains supply that charges it too).
struct ClassDevices {
  std::string_view className;
  const char* subsystem;
  const char* attribute;  // nullptr: any device of the subsystem
  const char* value;
};
constexpr ClassDevices kClassDevices[] = {
    {"TesvarSmartBattery", "power_supply", "type", "Battery"},
    {kServiceClass, "misc", nullptr, nullptr},
};

struct DeviceUnref {
  void operator()(sd_device* d) const { sd_device_unref(d); }
};
struct EnumeratorUnref {
  void operator()(sd_device_enumerator* e) const { sd_device_enumerator_unref(e); }
};
using DevicePtr = std::unique_ptr<sd_device, DeviceUnref>;
using EnumeratorPtr = std::unique_ptr<sd_device_enumerator, EnumeratorUnref>;

// The devices of one query in sysfs order. Devices udev has not processed
// are included: on a plain kernel with no udev none ever is.
EnumeratorPtr enumerator() {
  sd_device_enumerator* e = nullptr;
  if (sd_device_enumerator_new(&e) < 0) return nullptr;
  EnumeratorPtr owned(e);
  if (sd_device_enumerator_allow_uninitialized(e) < 0) return nullptr;
  return owned;
}

std::optional<std::string> syspathOf(sd_device* device) {
  const char* path = nullptr;
  if (sd_device_get_syspath(device, &path) < 0 || !path) return std::nullopt;
  return std::string(path);
}

// Whether the device's KOLVRAND_SERVICE property is the class name, whole.
bool namedFor(sd_device* device, std::string_view className) {
  const char* value = nullptr;
  return sd_device_get_property_value(device, kServiceProperty, &value) >= 0 && value &&
         className == value;
}

// Whether the device's parent is bound to a driver of the class's name.
bool drivenBy(sd_device* device, std::string_view className) {
  sd_device* parent = nullptr;
  const char* driver = nullptr;
  return sd_device_get_parent(device, &parent) >= 0 && sd_device_get_driver(parent, &driver) >= 0 &&
         driver && className == driver;
}

std::optional<std::string> findByProperty(std::string_view className) {
  EnumeratorPtr e = enumerator();
  if (!e || sd_device_enumerator_add_match_property(e.get(), kServiceProperty,
                                                    std::string(className).c_str()) < 0)
    return std::nullopt;
  for (sd_device* d = sd_device_enumerator_get_device_first(e.get()); d;
       d = sd_device_enumerator_get_device_next(e.get())) {
    // The match is on a glob; the class name must be the whole value.
    if (namedFor(d, className)) return syspathOf(d);
  }
  return std::nullopt;
}

std::optional<std::string> findByDriver(std::string_view className) {
  const ClassDevices* devices = nullptr;
  for (const ClassDevices& d : kClassDevices)
    if (d.className == className) devices = &d;
  if (!devices) return std::nullopt;
  EnumeratorPtr e = enumerator();
  if (!e || sd_device_enumerator_add_match_subsystem(e.get(), devices->subsystem, 1) < 0 ||
      (devices->attribute &&
       sd_device_enumerator_add_match_sysattr(e.get(), devices->attribute, devices->value, 1) < 0))
    return std::nullopt;
  for (sd_device* d = sd_device_enumerator_get_device_first(e.get()); d;
       d = sd_device_enumerator_get_device_next(e.get()))
    if (drivenBy(d, className)) return syspathOf(d);
  return std::nullopt;
}

// An attribute's text without its final line feeds; nullopt when it cannot
// be read (ENODATA: the driver has no value yet) or is a directory.
std::optional<std::string> attribute(sd_device* device, const char* name) {
  const char* value = nullptr;
  if (sd_device_get_sysattr_value(device, name, &value) < 0 || !value) return std::nullopt;
  return std::string(value);
}

bool hasDirectory(sd_device* device, const char* name) {
  const char* value = nullptr;
  return sd_device_get_sysattr_value(device, name, &value) == -EISDIR;
}

// A decimal integer that a signed or unsigned 32-bit integer can hold.
std::optional<Number> chemIDNumber(std::string_view text) {
  int64_t v = 0;
  const char* end = text.data() + text.size();
  auto [ptr, ec] = std::from_chars(text.data(), end, v);
  if (text.empty() || ec != std::errc() || ptr != end || v < INT32_MIN || v > UINT32_MAX)
    return std::nullopt;
  return Number::fromSigned(v);
}

// "BatteryData": the chem ID and the serial number, each only when its file
// holds a value of its form.
Value batteryData(sd_device* device) {
  Dictionary data;
  if (auto text = attribute(device, "algo_chem_id"))
    if (auto number = chemIDNumber(*text)) data.set("AlgoChemID", *number);
  if (auto serial = attribute(device, "serial_number")) data.set("BatterySerialNumber", *serial);
  return data;
}

// "KVRVector": the battery_model group as "KVRBatteryModel", its digest as
// "RCParamsHash" when the file spells at least one byte in hex.
Value kvrVector(sd_device* device) {
  Dictionary vector;
  if (!hasDirectory(device, "battery_model")) return vector;
  Dictionary model;
  if (auto text = attribute(device, "battery_model/rc_params_hash"))
    if (auto bytes = fromHex(*text); bytes && !bytes->empty())
      model.set(kParamsHashKey, Data(bytes->begin(), bytes->end()));
  vector.set(kBatteryModelKey, std::move(model));
  return vector;
}

class LinuxRegistry final : public Registry {
 public:
  // A scan reads the properties of every device in sysfs, and one upload
  // looks each class up several times: the device found is kept, and at the
  // next lookup only it is checked again, the scan repeated when it is gone
  // or no longer stands for the class. Its values are still read afresh.
  uint32_t findService(std::string_view className) override {
    if (const uint32_t kept = keptService(className)) return kept;
    bool byProperty = true;
    std::optional<std::string> path = findByProperty(className);
    if (!path) {
      byProperty = false;
      path = findByDriver(className);
    }
    if (!path) return 0;
    std::lock_guard lock(mutex_);
    uint32_t handle = 0;
    for (size_t i = 0; i < services_.size() && !handle; ++i)
      if (services_[i] == *path) handle = static_cast<uint32_t>(i + 1);
    if (!handle) {
      services_.push_back(*path);
      handle = static_cast<uint32_t>(services_.size());
    }
    found_[std::string(className)] = {handle, byProperty};
    return handle;
  }

  std::optional<Value> property(uint32_t service, std::string_view key) override {
    DevicePtr device = deviceOf(service);
    if (!device) return std::nullopt;
    if (key == "BatteryData") return batteryData(device.get());
    if (key == kVectorProperty) return kvrVector(device.get());
    return std::nullopt;
  }

  int32_t open(uint32_t service, uint32_t type, uint32_t* connection) override {
    if (!connection) return kIOReturnBadArgument;
    *connection = 0;
    DevicePtr device = deviceOf(service);
    if (!device) return kIOReturnNoDevice;
    if (type != 0) return kIOReturnBadArgument;
    const char* node = nullptr;
    if (sd_device_get_devname(device.get(), &node) < 0 || !node) return kIOReturnUnsupported;
    const int fd = ::open(node, O_RDWR | O_CLOEXEC | O_NOCTTY);
    if (fd < 0) {
      const int err = errno;
      os_log_debug(platformLog("registry"), "cannot open %s: %s\n", node, std::strerror(err));
      return ioReturnFromErrno(err);
    }
    std::lock_guard lock(mutex_);
    const uint32_t id = nextConnection_++;
    connections_.emplace(id, fd);
    *connection = id;
    return kIOReturnSuccess;
  }

  int32_t callStructMethod(uint32_t connection, uint32_t selector,
                           std::span<const uint8_t> input) override {
    const int fd = connectionFd(connection);
    if (fd < 0) return kIOReturnNotOpen;
    if (input.size() > UINT32_MAX) return kIOReturnBadArgument;
    tesvar_kvr_call call{};
    call.selector = selector;
    call.input_size = static_cast<uint32_t>(input.size());
    call.input = reinterpret_cast<uintptr_t>(input.data());
    if (::ioctl(fd, TESVAR_KVR_IOC_CALL_STRUCT, &call) == 0) return kIOReturnSuccess;
    const int err = errno;
    os_log_debug(platformLog("registry"), "setBatteryParams refused: %s\n", std::strerror(err));
    return ioReturnFromErrno(err);
  }

  void close(uint32_t connection) override {
    int fd = -1;
    {
      std::lock_guard lock(mutex_);
      auto it = connections_.find(connection);
      if (it == connections_.end()) return;
      fd = it->second;
      connections_.erase(it);
    }
    ::close(fd);
  }

 private:
  // A fresh view of the service's device, so that nothing read is cached.
  DevicePtr deviceOf(uint32_t service) {
    std::string path;
    {
      std::lock_guard lock(mutex_);
      if (service == 0 || service > services_.size()) return nullptr;
      path = services_[service - 1];
    }
    sd_device* device = nullptr;
    if (sd_device_new_from_syspath(&device, path.c_str()) < 0) return nullptr;
    return DevicePtr(device);
  }

  uint32_t keptService(std::string_view className) {
    Found found;
    {
      std::lock_guard lock(mutex_);
      auto it = found_.find(className);
      if (it == found_.end()) return 0;
      found = it->second;
    }
    DevicePtr device = deviceOf(found.service);
    if (!device) return 0;
    const bool stands =
        found.byProperty ? namedFor(device.get(), className) : drivenBy(device.get(), className);
    return stands ? found.service : 0;
  }

  int connectionFd(uint32_t connection) {
    std::lock_guard lock(mutex_);
    auto it = connections_.find(connection);
    return it == connections_.end() ? -1 : it->second;
  }

  std::mutex mutex_;
  std::vector<std::string> services_;  // syspaths; a handle is a position from 1
  struct Found {
    uint32_t service = 0;
    bool byProperty = false;  // else by the driver's name
  };
  std::map<std::string, Found, std::less<>> found_;  // by class name
  std::map<uint32_t, int> connections_;
  uint32_t nextConnection_ = 1;
};

}  // namespace

IOReturn ioReturnFromErrno(int err) {
  switch (err) {
    case ENOENT:
    case ENODEV:
    case ENXIO:
      return kIOReturnNoDevice;
    case EACCES:
    case EPERM:
      return kIOReturnNotPrivileged;
    case EINVAL:
    case EFAULT:
      return kIOReturnBadArgument;
    case EOPNOTSUPP:
    case ENOTTY:
      return kIOReturnUnsupported;
    case EBUSY:
    case EAGAIN:
      return kIOReturnBusy;
    case EINTR:
      return kIOReturnAborted;
    case ENOMEM:
      return kIOReturnNoMemory;
    default:
      return kIOReturnError;
  }
}

std::unique_ptr<Registry> makeLinuxRegistry() {
  return std::make_unique<LinuxRegistry>();
}

}  // namespace kolvrand::platform
