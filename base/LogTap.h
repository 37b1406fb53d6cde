// SPDX-License-Identifier: MIT
// The first error line that one thread logs during a piece of work, whatever
// log it goes to: the innermost line of the chain a failure leaves, for a
// one-line account of the work's outcome.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace kolvrand {

// Keeps, while it lives, the first error-level message logged on the thread
// that made it (the text without its line feed). Taps nest: the innermost one
// alive gets the message.
class FirstErrorTap {
 public:
  FirstErrorTap();
  ~FirstErrorTap();
  FirstErrorTap(const FirstErrorTap&) = delete;
  FirstErrorTap& operator=(const FirstErrorTap&) = delete;

  const std::optional<std::string>& line() const { return line_; }

  // Called for every error message as it is emitted.
  static void note(std::string_view message);

 private:
  FirstErrorTap* outer_;
  std::optional<std::string> line_;
};

}  // namespace kolvrand
