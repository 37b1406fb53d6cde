// SPDX-License-Identifier: MIT
// The hash term of one optional float field.
#pragma once

#include <cmath>
#include <cstdint>

namespace kolvrand {

inline constexpr uint64_t kPBHashMultiplier = 2654435761u;  // 0x9e3779b1

namespace detail {

// Truncates toward zero and saturates: NaN and anything not above zero give 0,
// anything at or above 2^64 gives the maximum. A plain cast would be undefined
// for those inputs.
inline uint64_t saturatingToUint64(double x) {
  if (!(x > 0.0)) return 0;
  if (x >= 18446744073709551616.0) return UINT64_MAX;
  return static_cast<uint64_t>(x);
}

}  // namespace detail

// The integer part of |f| rounded half up, reduced mod 2^64, times the
// multiplier, plus the fraction that rounding dropped as a 0.64 fixed-point
// number (a fraction rounded up gives a negative difference and so 0). The
// values 0.0 and -0.0 hash alike, as they compare equal; NaN and the
// infinities give 0.
inline uint64_t PBFloatHash(float f) {
  const double d = f;
  const double a = f < 0 ? -d : d;
  const double r = std::floor(a + 0.5);
  const uint64_t i = detail::saturatingToUint64(std::fmod(r, 18446744073709551616.0));
  const uint64_t g = detail::saturatingToUint64((a - r) * 18446744073709551616.0);
  return i * kPBHashMultiplier + g;
}

}  // namespace kolvrand
