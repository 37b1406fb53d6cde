// SPDX-License-Identifier: MIT
// A device described by the files of one directory, for development and
// tests on machines without the battery and power-management drivers:
//
//   DEVICE/device.json                 kernel variables, registry, driver results
//                                      (a property given as null is absent)
//   DEVICE/Library                     the system Library directory
//   DEVICE/state                       the defaults suites
//   DEVICE/driver/battery_params.bin   the last record the driver accepted
#include <cstring>
#include <map>
#include <mutex>
#include <set>
#include <vector>

#include "base/CommonCrypto.h"
#include "base/ValueJSON.h"
#include "platform/Backend.h"
#include "platform/FileManager.h"
#include "platform/IOKit.h"
#include "platform/Internal.h"

namespace kolvrand::platform {

namespace {

using namespace kvr_driver;

class SimulatedDevice final : public Backend, public KernelVariables, public Registry {
 public:
  explicit SimulatedDevice(const std::filesystem::path& root) {
    std::error_code ec;
    root_ = std::filesystem::absolute(root, ec);
    if (ec) root_ = root;
    std::string error;
    if (!load(&error)) {
      os_log_error(platformLog("device"), "simulated device %s: %s\n", root_.string(), error);
      kernel_.clear();
      classes_.clear();
      openResult_ = setParamsResult_ = 0;
    }
  }

  // Backend
  KernelVariables& kernelVariables() override { return *this; }
  Registry& registry() override { return *this; }
  std::filesystem::path libraryDirectory() override { return root_ / "Library"; }
  std::filesystem::path stateDirectory() override { return root_ / "state"; }

  // KernelVariables
  std::optional<std::string> value(std::string_view name) override {
    auto it = kernel_.find(name);
    if (it == kernel_.end()) return std::nullopt;
    return it->second;
  }

  // Registry: a service handle is the class's position in device.json, from 1.
  uint32_t findService(std::string_view className) override {
    for (size_t i = 0; i < classes_.size(); ++i)
      if (classes_[i].name == className) return static_cast<uint32_t>(i + 1);
    return 0;
  }

  std::optional<Value> property(uint32_t service, std::string_view key) override {
    const auto* entry = serviceEntry(service);
    if (!entry || entry->absent.contains(key)) return std::nullopt;
    if (const Value* v = entry->properties.find(key)) return *v;
    if (entry->name == kServiceClass && key == kVectorProperty) return publishedHash();
    return std::nullopt;
  }

  int32_t open(uint32_t service, uint32_t type, uint32_t* connection) override {
    if (!connection) return kIOReturnBadArgument;
    *connection = 0;
    const auto* entry = serviceEntry(service);
    if (!entry || type != 0) return kIOReturnBadArgument;
    if (entry->name != kServiceClass) return kIOReturnUnsupported;
    if (openResult_ != 0) return openResult_;
    std::lock_guard lock(mutex_);
    uint32_t id = nextConnection_++;
    connections_.emplace(id, service);
    *connection = id;
    return kIOReturnSuccess;
  }

  int32_t callStructMethod(uint32_t connection, uint32_t selector,
                           std::span<const uint8_t> input) override {
    std::lock_guard lock(mutex_);
    if (!connections_.contains(connection)) return kIOReturnNotOpen;
    if (selector != kSetBatteryParamsSelector || input.size() != kBatteryParamsSize)
      return kIOReturnBadArgument;
    if (setParamsResult_ != 0) return setParamsResult_;
    std::string step;
    std::error_code ec;
    std::filesystem::create_directories(paramsPath().parent_path(), ec);
    const int err = ec ? 0
                       : replaceFile(paramsPath(),
                                     std::string_view(reinterpret_cast<const char*>(input.data()),
                                                      input.size()),
                                     0600, &step);
    if (ec || err) {
      os_log_error(platformLog("device"), "simulated driver cannot keep the record: %s\n",
                   ec ? ec.message() : step + ": " + std::strerror(err));
      return kIOReturnError;
    }
    return kIOReturnSuccess;
  }

  void close(uint32_t connection) override {
    std::lock_guard lock(mutex_);
    connections_.erase(connection);
  }

 private:
  struct ClassEntry {
    std::string name;
    Dictionary properties;
    // Given as null: absent, even where the driver would publish a value.
    std::set<std::string, std::less<>> absent;
  };

  std::filesystem::path paramsPath() const { return root_ / "driver" / "battery_params.bin"; }

  const ClassEntry* serviceEntry(uint32_t service) const {
    if (service == 0 || service > classes_.size()) return nullptr;
    return &classes_[service - 1];
  }

  // What the driver publishes once it holds a record: the record's SHA-1.
  std::optional<Value> publishedHash() const {
    auto bytes = readFile(paramsPath());
    if (!bytes) return std::nullopt;
    SHA1Digest digest = sha1(bytes->data(), bytes->size());
    return Value(Dictionary{
        {kBatteryModelKey, Dictionary{{kParamsHashKey, Data(digest.begin(), digest.end())}}}});
  }

  static bool fail(std::string* error, std::string what) {
    *error = std::move(what);
    return false;
  }

  static bool readResult(const JSON& driver, const char* key, int32_t* out, std::string* error) {
    auto it = driver.find(key);
    if (it == driver.end()) return true;
    // Return codes are given either signed or as their unsigned 32-bit form.
    if (it->is_number_integer() && !it->is_number_unsigned()) {
      int64_t v = it->get<int64_t>();
      if (v >= INT32_MIN && v <= INT32_MAX) {
        *out = static_cast<int32_t>(v);
        return true;
      }
    } else if (it->is_number_unsigned()) {
      uint64_t v = it->get<uint64_t>();
      if (v <= UINT32_MAX) {
        *out = static_cast<int32_t>(static_cast<uint32_t>(v));
        return true;
      }
    }
    return fail(error, std::string("driver.") + key + " is not a 32-bit integer");
  }

  bool load(std::string* error) {
    // Read like the settings: never waiting on a FIFO, never more than a
    // device description can need.
    FileError why;
    auto text = readFile(root_ / "device.json", &why);
    if (!text) return fail(error, "cannot read device.json: " + why.reason);
    bool tooDeep = false;
    // Read as a view, through the lexer the JSON conversion uses: one copy of
    // it in the daemon.
    JSON doc = JSON::parse(std::string_view(*text), jsonDepthLimit(&tooDeep), false);
    if (doc.is_discarded()) return fail(error, "device.json is not valid JSON");
    if (tooDeep) return fail(error, "device.json is nested too deep");
    if (!doc.is_object()) return fail(error, "device.json is not an object");

    if (auto it = doc.find("sysctl"); it != doc.end()) {
      if (!it->is_object()) return fail(error, "sysctl is not an object");
      for (auto v = it->begin(); v != it->end(); ++v) {
        if (v->is_string()) {
          kernel_[v.key()] = v->get<std::string>() + '\0';
          continue;
        }
        ValueError why;
        auto value = v->is_object() ? valueFromJSON(*v, &why) : std::nullopt;
        if (!value || !value->isData())
          return fail(error, "sysctl " + v.key() + " is neither a string nor {\"$data\": HEX}" +
                                 (why.reason.empty() ? "" : " (" + why.message() + ")"));
        const Data& d = *value->asData();
        kernel_[v.key()] = std::string(d.begin(), d.end());
      }
    }

    if (auto it = doc.find("registry"); it != doc.end()) {
      if (!it->is_object()) return fail(error, "registry is not an object");
      for (auto c = it->begin(); c != it->end(); ++c) {
        if (!c->is_object()) return fail(error, "registry class " + c.key() + " is not an object");
        ClassEntry entry{c.key(), {}, {}};
        for (auto p = c->begin(); p != c->end(); ++p) {
          if (p->is_null()) {
            entry.absent.insert(p.key());
            continue;
          }
          ValueError why;
          auto value = valueFromJSON(*p, &why);
          if (!value)
            return fail(error, "registry " + c.key() + "." + p.key() + ": " + why.message());
          entry.properties.set(p.key(), std::move(*value));
        }
        classes_.push_back(std::move(entry));
      }
    }

    if (auto it = doc.find("driver"); it != doc.end()) {
      if (!it->is_object()) return fail(error, "driver is not an object");
      if (!readResult(*it, "openResult", &openResult_, error) ||
          !readResult(*it, "setBatteryParamsResult", &setParamsResult_, error))
        return false;
    }
    return true;
  }

  std::filesystem::path root_;
  // Read once at start: the device does not change while the daemon runs.
  std::map<std::string, std::string, std::less<>> kernel_;
  std::vector<ClassEntry> classes_;
  int32_t openResult_ = 0;
  int32_t setParamsResult_ = 0;

  std::mutex mutex_;  // connections and the kept record
  std::map<uint32_t, uint32_t> connections_;
  uint32_t nextConnection_ = 1;
};

}  // namespace

std::shared_ptr<Backend> makeSimulatedDevice(const std::filesystem::path& device) {
  return std::make_shared<SimulatedDevice>(device);
}

}  // namespace kolvrand::platform
