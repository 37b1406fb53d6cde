// The boot-session gate on simulated devices, where the daemon's own runs do
// not go: no handler, and defaults that cannot be opened. (An unreadable boot
// session is crossed by the daemon's runs.)
#include <gtest/gtest.h>

#include "daemon/BatteryModelTask.h"
#include "pipeline/DaemonIdentifier.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;

void runTask(BatteryModelDataHandler* handler) {
  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"), handler);
}

TEST(BatteryModelTask, NilHandlerReadsChemIDZeroAndFails) {
  test::TestDevice device;
  runTask(nullptr);
  EXPECT_EQ(device.logLines(), (Lines{"debug [main] Battery data upload run for chemId 0x0",
                                      "error [main] Battery data upload failed"}));
  EXPECT_FALSE(device.state().contains("savedBootUUID"));
}

TEST(BatteryModelTask, DefaultsThatCannotBeOpenedEndTheTask) {
  test::TestDevice device;
  std::ofstream(device.dir() / "state") << "not a directory";
  runTask(BatteryModelDataHandler::init().get());
  Lines lines = device.logLines();
  ASSERT_FALSE(lines.empty());
  EXPECT_EQ(lines.back(), "error [main] Could not allocate defaults");
  EXPECT_EQ(std::count(lines.begin(), lines.end(), lines.back()), 1);
}

}  // namespace
}  // namespace kolvrand
