// kolvrand: once per boot session, uploads the battery model to the kernel
// power-management driver; keeps the battery-aging activity registered.
#include <string>

#include "daemon/BatteryAgingActivity.h"
#include "daemon/BatteryModelTask.h"
#include "daemon/ConditionCheckingAgent.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/Activity.h"
#include "platform/Dispatch.h"
#include "platform/Log.h"

namespace {

// Written once here, before the task is queued and the activity registered;
// only read afterwards.
std::shared_ptr<kolvrand::ConditionCheckingAgent> gAgent;
std::shared_ptr<kolvrand::BatteryModelDataHandler> gHandler;

}  // namespace

int main() {
  using namespace kolvrand;

  os_log_t mainLog = os_log_create(DaemonIdentifier, "main");

  const std::string queueLabel = std::string(DaemonIdentifier) + ".batterymodelqueue";
  dispatch_queue_t queue = dispatch_queue_create(
      queueLabel.c_str(), dispatch_queue_attr_make_with_autorelease_frequency(
                              DISPATCH_QUEUE_SERIAL, DISPATCH_AUTORELEASE_FREQUENCY_WORK_ITEM));

  gAgent = ConditionCheckingAgent::sharedInstance();
  gHandler = BatteryModelDataHandler::sharedInstance();
  if (!gAgent || !gHandler) os_log_error(mainLog, "kolvrand failed to start\n");

  dispatch_async(queue, [mainLog] { runBatteryModelTask(mainLog, gHandler.get()); });

  const std::string activityName = std::string(DaemonIdentifier) + ".batteryAgingUpdate";
  xpc_activity_register(activityName.c_str(), XPC_ACTIVITY_CHECK_IN,
                        [mainLog](xpc_activity_t activity) {
                          batteryAgingActivityHandler(activity, mainLog, gAgent.get());
                        });

  dispatch_main();
}
