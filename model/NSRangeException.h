// SPDX-License-Identifier: MIT
// The one exception of the message classes: an element index at or past the
// end of a repeated field.
#pragma once

#include <cstddef>
#include <exception>
#include <string>

namespace kolvrand {

class NSRangeException : public std::exception {
 public:
  NSRangeException(size_t index, size_t count)
      : reason_("idx (" + std::to_string(index) + ") is out of range (" + std::to_string(count) +
                ")") {}

  const char* what() const noexcept override { return reason_.c_str(); }
  const std::string& reason() const { return reason_; }

 private:
  std::string reason_;
};

}  // namespace kolvrand
