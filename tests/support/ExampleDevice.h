// SPDX-License-Identifier: MIT
// Temporary copies of examples/device for the daemon's runs, whose settings
// already hold a boot session of earlier and a value of the aging activity's,
// and one run of the daemon there checked for what every run must hold.
#pragma once

#include <gtest/gtest.h>

#include <fstream>
#include <nlohmann/json.hpp>

#include "tests/support/DaemonProcess.h"
#include "tests/support/Files.h"

namespace kolvrand::test {

namespace fs = std::filesystem;
using nlohmann::json;
using Lines = std::vector<std::string>;

inline const char* const kModel = "Library/KVR/BatteryModels/T618e/2168.rcmodel";
inline const char* const kState = "state/com.tesvar.kolvrand.json";
inline const json kEarlierState = {
    {"savedBootUUID", "earlier-boot"}, {"savedChemID", 8552}, {"updateConditionMet", false}};
inline const std::string kBootUUID =
    "6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b";  // of the example device

inline const std::string kExample =
    readFile(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device" / kModel);

struct ExampleDevice {
  ExampleDevice() {
    fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device", dir, fs::copy_options::recursive);
    writeFile(path(kState), kEarlierState.dump(2));
  }
  fs::path path(const fs::path& relative) const { return dir / relative; }
  // Whole, and holding the earlier values, or the new boot session after an
  // upload.
  void expectSettings(bool uploaded) const {
    json expected = kEarlierState;
    if (uploaded) expected["savedBootUUID"] = kBootUUID;
    expected["savedChemID"] = savedChemID;
    EXPECT_EQ(json::parse(readFile(path(kState)), nullptr, false), expected)
        << readFile(path(kState));
  }

  const TempDir temp;
  const fs::path dir = temp.path();
  std::vector<std::string> launcher;  // runs the daemon in its place, such as setpriv
  int64_t savedChemID = 8552;         // what the run stores: the battery's, 6439 made 8552
};

enum class Outcome { Uploaded, Failed, NoBootSession };

// Runs the daemon until its battery-model task has ended, then asks for the
// aging activity again and again (meanwhile too, `during` the task) and stops
// it. Checks what every run must hold: a clean stop, well-formed lines, the
// task's last line once, no gigabyte spent, the activity still served, whole
// settings, a record in the driver only if it took one; returns the lines.
inline Lines runDaemon(const ExampleDevice& device, Outcome outcome, bool during = false) {
  DaemonProcess daemon(device.dir, "debug", device.launcher);
  const std::string last =
      outcome == Outcome::Uploaded        ? "default [main] Battery data upload succeeded"
      : outcome == Outcome::NoBootSession ? "error [main] Unable to get current boot UUID"
                                          : "error [main] Battery data upload failed";
  // Signals are served once the activity has checked in.
  EXPECT_TRUE(daemon.waitForLine({"checking in"})) << daemon.rawStderr();
  EXPECT_TRUE(during || daemon.waitForLine({last}, std::chrono::seconds(120)))
      << daemon.rawStderr();
  for (int i = 0; i < 50; ++i) {
    daemon.signal(SIGUSR1);
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
  EXPECT_TRUE(daemon.waitForLine({last}, std::chrono::seconds(120))) << daemon.rawStderr();
  EXPECT_TRUE(daemon.waitForLine({"compensation has finished successfully"})) << daemon.rawStderr();
  std::ifstream status("/proc/" + std::to_string(daemon.pid()) + "/status");
  long peakKiB = 0;
  for (std::string line; std::getline(status, line);)
    if (line.starts_with("VmHWM:")) peakKiB = std::stol(line.substr(6));
  EXPECT_LT(peakKiB, 1 << 20) << "KiB at peak";
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0) << daemon.rawStderr();

  bool wellFormed = false;
  const Lines lines = daemon.lines(&wellFormed);
  EXPECT_TRUE(wellFormed) << daemon.rawStderr();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), last), 1) << daemon.rawStderr();
  device.expectSettings(outcome == Outcome::Uploaded);
  EXPECT_EQ(fs::exists(device.path("driver/battery_params.bin")), outcome == Outcome::Uploaded);
  return lines;
}

}  // namespace kolvrand::test
