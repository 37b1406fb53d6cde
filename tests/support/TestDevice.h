// SPDX-License-Identifier: MIT
// A simulated device in a temporary directory, installed as the platform
// backend for the test's duration; a log sink that keeps every message; and
// model files made in tests.
#pragma once

#include <filesystem>
#include <fstream>
#include <memory>
#include <mutex>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "model/OTAParamRC.h"
#include "pipeline/PBStreamWriter.h"
#include "platform/Backend.h"
#include "platform/Log.h"
#include "tests/support/Files.h"

namespace kolvrand::test {

// Keeps messages as "LEVEL [category] text", the text without its line feed.
class LogCapture : public LogSink {
 public:
  LogCapture() = default;
  void write(LogLevel level, std::string_view, std::string_view category,
             std::string_view message) override {
    static const char* names[] = {"error", "default", "debug"};
    if (!message.empty() && message.back() == '\n') message.remove_suffix(1);
    std::lock_guard lock(mutex_);
    lines_.push_back(std::string(names[static_cast<int>(level)]) + " [" + std::string(category) +
                     "] " + std::string(message));
  }
  std::vector<std::string> lines() const {
    std::lock_guard lock(mutex_);
    return lines_;
  }
  void clear() {
    std::lock_guard lock(mutex_);
    lines_.clear();
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> lines_;
};

// A model file of `messages`.
inline std::string modelFile(const std::vector<std::shared_ptr<OTAParamRC>>& messages) {
  std::vector<uint8_t> bytes =
      PBStreamWriter::dataForMessages(std::span<const std::shared_ptr<OTAParamRC>>(messages));
  return std::string(bytes.begin(), bytes.end());
}

// The device of examples/device, with every field a test may change.
inline nlohmann::json defaultDeviceJSON() {
  return {
      {"sysctl",
       {{"kern.bootsessionuuid", "11111111-2222-3333-4444-555555555555"},
        {"hw.targettype", "T618e"}}},
      {"registry",
       {{"TesvarSmartBattery",
         {{"BatteryData", {{"AlgoChemID", 6439}, {"BatterySerialNumber", "F5D2470A1B2C3D4E"}}}}},
        {"TesvarKVR", nlohmann::json::object()}}},
      {"driver", {{"openResult", 0}, {"setBatteryParamsResult", 0}}},
  };
}

class TestDevice {
 public:
  explicit TestDevice(const nlohmann::json& device = defaultDeviceJSON()) {
    writeDeviceJSON(device);
    capture_ = std::make_shared<LogCapture>();
    setLogSink(capture_);
    setLogLevelSpec("debug");
    reload();
  }
  ~TestDevice() {
    platform::setBackend(nullptr);
    setLogSink(nullptr);
    setLogLevelSpec("");
  }
  TestDevice(const TestDevice&) = delete;
  TestDevice& operator=(const TestDevice&) = delete;

  const std::filesystem::path& dir() const { return dir_.path(); }
  void writeDeviceJSON(const nlohmann::json& device) {
    writeFile(dir() / "device.json", device.dump(2));
  }
  // Reads device.json again, as a new start of the daemon does.
  void reload() { platform::setBackend(platform::makeSimulatedDevice(dir())); }

  // Puts `bytes` at Library/KVR/BatteryModels/RELATIVE.
  void installModel(const std::string& relative, const std::string& bytes) {
    writeFile(dir() / "Library/KVR/BatteryModels" / relative, bytes);
  }
  std::filesystem::path statePath() const { return dir() / "state/com.tesvar.kolvrand.json"; }
  nlohmann::json state() const {
    std::ifstream in(statePath());
    if (!in) return nlohmann::json::object();
    return nlohmann::json::parse(in, nullptr, false);
  }

  std::vector<std::string> logLines() const { return capture_->lines(); }
  void clearLog() { capture_->clear(); }

 private:
  TempDir dir_;
  std::shared_ptr<LogCapture> capture_;
};

}  // namespace kolvrand::test
