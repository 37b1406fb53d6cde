// SPDX-License-Identifier: MIT
// What each of the daemon's process-wide objects holds: the defaults of the
// daemon's suite and a log of its own category, and the one shared instance.
#pragma once

#include <memory>

#include "pipeline/DaemonIdentifier.h"
#include "platform/Defaults.h"
#include "platform/Dispatch.h"
#include "platform/Log.h"

namespace kolvrand {

template <typename Derived>
class DaemonAgent {
 public:
  // The one shared instance, made by Derived::init() on first use under a
  // once-only guard.
  static std::shared_ptr<Derived> sharedInstance() {
    static dispatch_once_t once;
    static std::shared_ptr<Derived> shared;
    dispatch_once(&once, [] { shared = Derived::init(); });
    return shared;
  }

  const std::shared_ptr<NSUserDefaults>& defaults() const { return defaults_; }
  void setDefaults(std::shared_ptr<NSUserDefaults> d) { defaults_ = std::move(d); }
  const os_log_t& log() const { return log_; }
  void setLog(os_log_t l) { log_ = std::move(l); }

 protected:
  // A new instance with its own defaults (suite DaemonIdentifier; nil when
  // the suite cannot be opened) and a log of `category`.
  static std::shared_ptr<Derived> make(const char* category) {
    auto instance = std::make_shared<Derived>();
    instance->setDefaults(NSUserDefaults::initWithSuiteName(DaemonIdentifier));
    instance->setLog(os_log_create(DaemonIdentifier, category));
    return instance;
  }

  std::shared_ptr<NSUserDefaults> defaults_;
  os_log_t log_;
};

}  // namespace kolvrand
