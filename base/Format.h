// SPDX-License-Identifier: MIT
// printf-style formatting in which %@ prints an object's description (a nil
// object as "(null)"), for the messages of the logs.
#pragma once

#include <concepts>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

namespace kolvrand {

// One formatting argument. Objects are carried by their description, taken
// only when the message is enabled.
struct LogArg {
  struct Object {
    std::optional<std::string> text;  // nullopt prints "(null)"
  };
  std::variant<int64_t, uint64_t, double, const void*, const char*, std::string_view, Object> v;
};

template <typename T>
concept Describable = requires(const T& t) {
  { t.description() } -> std::convertible_to<std::string>;
};

// A smart pointer to a describable object (a nil one prints "(null)").
template <typename T>
concept DescribablePointer = requires(const T& p) {
  p.get();
  { p->description() } -> std::convertible_to<std::string>;
};

template <typename T>
LogArg makeLogArg(const T& a) {
  using U = std::remove_cvref_t<T>;
  if constexpr (std::is_same_v<U, bool>) {
    return {int64_t{a}};
  } else if constexpr (std::is_integral_v<U> && std::is_signed_v<U>) {
    return {int64_t{a}};
  } else if constexpr (std::is_integral_v<U>) {
    return {uint64_t{a}};
  } else if constexpr (std::is_enum_v<U>) {
    return {static_cast<int64_t>(a)};
  } else if constexpr (std::is_floating_point_v<U>) {
    return {double{a}};
  } else if constexpr (std::is_same_v<U, const char*> || std::is_same_v<U, char*>) {
    return {static_cast<const char*>(a)};
  } else if constexpr (std::is_array_v<U>) {
    return {static_cast<const char*>(a)};
  } else if constexpr (std::is_same_v<U, std::string> || std::is_same_v<U, std::string_view>) {
    return {std::string_view(a)};
  } else if constexpr (std::is_same_v<U, std::nullptr_t>) {
    return {LogArg::Object{}};
  } else if constexpr (std::is_same_v<U, std::optional<std::string>>) {
    return {LogArg::Object{a}};
  } else if constexpr (Describable<U>) {
    return {LogArg::Object{std::string(a.description())}};
  } else if constexpr (DescribablePointer<U>) {
    return a ? LogArg{LogArg::Object{std::string(a->description())}} : LogArg{LogArg::Object{}};
  } else if constexpr (std::is_pointer_v<U>) {
    return {static_cast<const void*>(a)};
  } else {
    static_assert(sizeof(U) == 0, "unsupported log argument");
  }
}

// Formats `format` as printf would for the conversions d i u x X o c s p f F
// e E g G a A %, with flags, width, precision and the length modifiers hh h l
// ll j z t; %@ prints an object (or a string), and "(null)" for nil, as %s
// does for a null C string. A directive without its argument prints nothing,
// surplus arguments are ignored, and a directive of another conversion, or
// with a width or precision above 4096, prints as it stands.
std::string formatLogMessage(std::string_view format, std::span<const LogArg> args);

}  // namespace kolvrand
