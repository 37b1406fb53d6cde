#include "daemon/ConditionCheckingAgent.h"

#include "pipeline/DaemonIdentifier.h"
#include "platform/Dispatch.h"

namespace kolvrand {

std::shared_ptr<ConditionCheckingAgent> ConditionCheckingAgent::sharedInstance() {
  static dispatch_once_t once;
  static std::shared_ptr<ConditionCheckingAgent> shared;
  dispatch_once(&once, [] { shared = init(); });
  return shared;
}

std::shared_ptr<ConditionCheckingAgent> ConditionCheckingAgent::init() {
  auto agent = std::make_shared<ConditionCheckingAgent>();
  agent->setDefaults(NSUserDefaults::initWithSuiteName(DaemonIdentifier));
  agent->setLog(os_log_create(DaemonIdentifier, "batteryAgingUpdate"));
  return agent;
}

bool ConditionCheckingAgent::performExecutionConditionChecking() {
  os_log_debug(log_, "%s Checking execution requirements\n",
               "-[ConditionCheckingAgent performExecutionConditionChecking]");
  return true;
}

}  // namespace kolvrand
