// SPDX-License-Identifier: MIT
// The real daemon on temporary copies of examples/device whose settings already
// hold a boot session of earlier and a value of the aging activity's. Killed
// at any moment, or asked for activities during the upload, it uploads whole
// or leaves the earlier settings intact, keeps serving the aging activity and
// exits 0 on SIGTERM. (What it does with hostile inputs is in the table of
// HostileInputTest.cpp.)
#include <random>

#include "pipeline/PBStreamReader.h"
#include "tests/support/ExampleDevice.h"

namespace kolvrand::test {
namespace {

// The model padded with empty messages up to the size cap: read whole, and
// only its first message kept, so the load costs time, not gigabytes (it took
// 6 GB when every message was); and it keeps the task busy for a while, so
// that the activities asked for meanwhile overlap the upload. Both sides
// finish, the settings hold both sides' keys, and a report of ThreadSanitizer's
// (./scripts/test --tsan) would break the lines or the exit status.
TEST(Concurrency, DaemonRunsActivitiesDuringTheUpload) {
  ExampleDevice device;
  writeFile(device.path(kModel),
            kExample + std::string(PBStreamReader::kMaxFileSize - kExample.size(), '\0'));
  runDaemon(device, Outcome::Uploaded, true);
}

// Killed at random moments of its first start, the next start finds whole
// settings, the earlier ones kept, and either skips (the upload had been
// confirmed and recorded) or uploads again.
TEST(CrashSafety, DaemonKilledDuringItsWorkRecoversAtTheNextStart) {
  std::mt19937 rng(std::random_device{}());
  std::uniform_int_distribution<int> delay(0, 60);
  for (int trial = 0; trial < 40; ++trial) {
    SCOPED_TRACE("trial " + std::to_string(trial));
    ExampleDevice device;
    {
      // Going out of scope, a daemon still running is killed with SIGKILL.
      DaemonProcess first(device.dir, "default");
      std::this_thread::sleep_for(std::chrono::milliseconds(delay(rng)));
    }
    DaemonProcess second(device.dir, "default");
    ASSERT_TRUE(second.waitForLine({"upload succeeded", "Skipping"})) << second.rawStderr();
    second.signal(SIGTERM);
    EXPECT_EQ(second.waitForExit(), 0);
    device.expectSettings(true);
    // No temporary file left beside the settings and their lock.
    EXPECT_EQ(std::distance(fs::directory_iterator(device.path("state")), {}), 2);
  }
}

}  // namespace
}  // namespace kolvrand::test
