// Scratch directories, device fixtures and a capturing log sink for the
// platform tests.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <mutex>
#include <string>
#include <vector>

#include "platform/Backend.h"
#include "platform/Log.h"

namespace kolvrand::test {

class TempDir {
 public:
  TempDir() {
    std::string tmpl = (std::filesystem::temp_directory_path() / "kolvrand-test.XXXXXX").string();
    if (!::mkdtemp(tmpl.data())) throw std::runtime_error("mkdtemp failed");
    path_ = tmpl;
  }
  ~TempDir() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }
  const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

inline void writeFile(const std::filesystem::path& path, std::string_view text) {
  std::filesystem::create_directories(path.parent_path());
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

inline std::string readFileText(const std::filesystem::path& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

struct LogEntry {
  LogLevel level;
  std::string subsystem, category, message;
};

class CaptureSink : public LogSink {
 public:
  void write(LogLevel level, std::string_view subsystem, std::string_view category,
             std::string_view message) override {
    std::lock_guard lock(mutex_);
    entries_.push_back(
        {level, std::string(subsystem), std::string(category), std::string(message)});
  }
  std::vector<LogEntry> entries() {
    std::lock_guard lock(mutex_);
    return entries_;
  }
  size_t count(LogLevel level, std::string_view category) {
    size_t n = 0;
    for (const auto& e : entries())
      if (e.level == level && e.category == category) ++n;
    return n;
  }

 private:
  std::mutex mutex_;
  std::vector<LogEntry> entries_;
};

// Installs a capturing sink for the life of the object.
class CapturedLog {
 public:
  CapturedLog() : sink_(std::make_shared<CaptureSink>()) { setLogSink(sink_); }
  ~CapturedLog() { setLogSink(nullptr); }
  CaptureSink& operator*() { return *sink_; }
  CaptureSink* operator->() { return sink_.get(); }

 private:
  std::shared_ptr<CaptureSink> sink_;
};

// A simulated device in a scratch directory, installed as the backend.
class DeviceFixture : public ::testing::Test {
 protected:
  void makeDevice(std::string_view deviceJson) {
    writeFile(dir.path() / "device.json", deviceJson);
    platform::setBackend(platform::makeSimulatedDevice(dir.path()));
  }
  void TearDown() override { platform::setBackend(nullptr); }

  TempDir dir;
};

}  // namespace kolvrand::test
