// SPDX-License-Identifier: MIT
#include "base/LogTap.h"

namespace kolvrand {

namespace {
thread_local FirstErrorTap* tCurrentTap = nullptr;
}

FirstErrorTap::FirstErrorTap() : outer_(tCurrentTap) {
  tCurrentTap = this;
}

FirstErrorTap::~FirstErrorTap() {
  tCurrentTap = outer_;
}

void FirstErrorTap::note(std::string_view message) {
  FirstErrorTap* tap = tCurrentTap;
  if (!tap || tap->line_) return;
  while (!message.empty() && (message.back() == '\n' || message.back() == ' '))
    message.remove_suffix(1);
  tap->line_ = std::string(message);
}

}  // namespace kolvrand
