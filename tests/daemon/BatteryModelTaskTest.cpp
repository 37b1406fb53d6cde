// The boot-session gate on simulated devices: which lines each start leaves
// and what it stores.
#include <gtest/gtest.h>

#include "daemon/BatteryModelTask.h"
#include "pipeline/DaemonIdentifier.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using test::TestDevice;
using Lines = std::vector<std::string>;

constexpr const char* kUUID = "11111111-2222-3333-4444-555555555555";
const std::string kNoModel =
    "error [batteryModelDataHandling] -[BatteryModelDataHandler getBatteryModelFileURLString:] "
    "<Error> file not present: ";

void runTask(BatteryModelDataHandler* handler) {
  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"), handler);
}

TEST(BatteryModelTask, NilHandlerReadsChemIDZeroAndFails) {
  TestDevice device;
  runTask(nullptr);
  EXPECT_EQ(device.logLines(), (Lines{"debug [main] Battery data upload run for chemId 0x0",
                                      "error [main] Battery data upload failed"}));
  EXPECT_FALSE(device.state().contains("savedBootUUID"));
}

// Every way the boot-session UUID can be unreadable ends the task at once.
TEST(BatteryModelTask, UnreadableBootUUIDEndsTheTask) {
  const nlohmann::json cases[] = {
      nullptr,              // no such kernel variable
      {{"$data", "c328"}},  // not UTF-8
      {{"$data", "ff"}},    // not UTF-8, no NUL
  };
  for (const auto& uuid : cases) {
    SCOPED_TRACE(uuid.dump());
    nlohmann::json json = test::defaultDeviceJSON();
    if (uuid.is_null())
      json["sysctl"].erase("kern.bootsessionuuid");
    else
      json["sysctl"]["kern.bootsessionuuid"] = uuid;
    TestDevice device(json);
    runTask(BatteryModelDataHandler::init().get());
    EXPECT_EQ(device.logLines(), Lines{"error [main] Unable to get current boot UUID"});
    EXPECT_FALSE(device.state().contains("savedChemID"));
  }
}

TEST(BatteryModelTask, DefaultsThatCannotBeOpenedEndTheTask) {
  TestDevice device;
  // A file where the state directory should be.
  std::ofstream(device.dir() / "state") << "not a directory";
  runTask(BatteryModelDataHandler::init().get());
  Lines lines = device.logLines();
  ASSERT_FALSE(lines.empty());
  EXPECT_EQ(lines.back(), "error [main] Could not allocate defaults");
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "error [main] Could not allocate defaults"), 1);
}

}  // namespace
}  // namespace kolvrand
