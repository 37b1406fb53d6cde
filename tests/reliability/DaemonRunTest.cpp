// SPDX-License-Identifier: MIT
// The real daemon on a temporary copy of examples/device whose settings
// already hold a boot session of earlier and a value of the aging activity's:
// asked for activities during the upload, it uploads whole, keeps serving the
// aging activity and exits 0 on SIGTERM. (What it does with hostile inputs is
// in the table of HostileInputTest.cpp; a settings writer killed at any
// moment, in SettingsWritersTest.cpp.)
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

}  // namespace
}  // namespace kolvrand::test
