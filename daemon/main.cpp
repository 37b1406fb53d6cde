// SPDX-License-Identifier: MIT
// kolvrand: once per boot session, uploads the battery model to the kernel
// power-management driver; keeps the battery-aging activity registered.
#include <cstdio>
#include <optional>
#include <string>
#include <string_view>

#include "base/LogTap.h"
#include "daemon/BatteryAgingActivity.h"
#include "daemon/BatteryModelTask.h"
#include "daemon/ConditionCheckingAgent.h"
#include "daemon/ServiceStatus.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/Activity.h"
#include "platform/Backend.h"
#include "platform/Dispatch.h"
#include "platform/Log.h"
#include "platform/ServiceManager.h"

namespace {

// Written once here, before the task is queued and the activity registered;
// only read afterwards.
std::shared_ptr<kolvrand::ConditionCheckingAgent> gAgent;
std::shared_ptr<kolvrand::BatteryModelDataHandler> gHandler;

constexpr const char* kUsage =
    "usage: kolvrand [--help | --version]\n"
    "\n"
    "The battery-model daemon. Started by systemd (kolvrand.service), it takes no\n"
    "arguments: once per boot session it uploads the battery model to the\n"
    "power-management driver and it serves the battery-aging activity (SIGUSR1)\n"
    "until SIGTERM.\n"
    "\n"
    "Environment: KOLVRAND_DEVICE=DIR (a simulated device), KOLVRAND_LOG_LEVEL,\n"
    "STATE_DIRECTORY. See kolvrand(8).\n";

// --help and --version answer and end; any other argument is a mistake. In
// both cases nothing of the daemon is touched: no log, no settings, no device.
std::optional<int> answerArguments(int argc, char** argv) {
  if (argc < 2) return std::nullopt;
  const std::string_view arg = argv[1];
  if (argc == 2 && arg == "--help") {
    std::fputs(kUsage, stdout);
    return 0;
  }
  if (argc == 2 && arg == "--version") {
    std::printf("kolvrand %s\n", KOLVRAND_VERSION);
    return 0;
  }
  const bool known = arg == "--help" || arg == "--version";
  std::fprintf(stderr, "kolvrand: unexpected argument \"%s\"\n%s", argv[known ? 2 : 1], kUsage);
  return 2;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace kolvrand;
  if (std::optional<int> status = answerArguments(argc, argv)) return *status;
  if (std::optional<std::string> error = platform::deviceSelectionError()) {
    std::fprintf(stderr, "kolvrand: %s\n", error->c_str());
    return 1;
  }

  os_log_t mainLog = os_log_create(DaemonIdentifier, "main");

  const std::string queueLabel = std::string(DaemonIdentifier) + ".batterymodelqueue";
  dispatch_queue_t queue = dispatch_queue_create(
      queueLabel.c_str(), dispatch_queue_attr_make_with_autorelease_frequency(
                              DISPATCH_QUEUE_SERIAL, DISPATCH_AUTORELEASE_FREQUENCY_WORK_ITEM));

  gAgent = ConditionCheckingAgent::sharedInstance();
  gHandler = BatteryModelDataHandler::sharedInstance();
  if (!gAgent || !gHandler) os_log_error(mainLog, "kolvrand failed to start\n");

  // The task's outcome becomes the service's status line (systemctl status).
  dispatch_async(queue, [mainLog] {
    const FirstErrorTap tap;
    const BatteryModelTaskResult result = runBatteryModelTask(mainLog, gHandler.get());
    platform::notifyServiceManager("STATUS=" +
                                   batteryModelStatus(result, gHandler.get(), tap.line()));
  });

  const std::string activityName = std::string(DaemonIdentifier) + ".batteryAgingUpdate";
  xpc_activity_register(activityName.c_str(), XPC_ACTIVITY_CHECK_IN,
                        [mainLog](xpc_activity_t activity) {
                          batteryAgingActivityHandler(activity, mainLog, gAgent.get());
                        });

  // Set up: the service manager may count the service as started. The
  // upload's outcome follows in the status line.
  platform::notifyServiceManager("READY=1");

  dispatch_main();
}
