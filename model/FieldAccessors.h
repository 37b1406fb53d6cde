// SPDX-License-Identifier: MIT
// Macros that turn a message's field list into its slots, accessors and
// table rows, so that each field is named, numbered and keyed exactly once.
//
// A field list is a macro taking five macro names, one per kind, and applying
// each to its fields in field-number order:
//   SUB(number, name, Name, key, Class)                  optional sub-message
//   LIST(number, list, List, element, Element, key)      repeated float
//   UINT32(number, name, Name, key)                      uint32 without presence
//   FLOAT(number, name, Name, key, bit)               optional float
//   ENUM(number, name, Name, key, bit)                optional enum (int32)
// `name` is the getter, `Name` the same with its first letter in upper case.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "model/FieldTable.h"

#define KVR_NO_FIELD(...)
#define KVR_SLOT(number, name, ...) name,

// The storage slot of every field, one enumeration per storage array.
#define KVR_FIELD_SLOTS(SlotsName, FIELDS)                                                 \
  struct SlotsName {                                                                       \
    enum Sub : uint8_t {                                                                   \
      FIELDS(KVR_SLOT, KVR_NO_FIELD, KVR_NO_FIELD, KVR_NO_FIELD, KVR_NO_FIELD) kSubCount   \
    };                                                                                     \
    enum List : uint8_t {                                                                  \
      FIELDS(KVR_NO_FIELD, KVR_SLOT, KVR_NO_FIELD, KVR_NO_FIELD, KVR_NO_FIELD) kListCount  \
    };                                                                                     \
    enum Float : uint8_t {                                                                 \
      FIELDS(KVR_NO_FIELD, KVR_NO_FIELD, KVR_NO_FIELD, KVR_SLOT, KVR_NO_FIELD) kFloatCount \
    };                                                                                     \
    enum Int : uint8_t {                                                                   \
      FIELDS(KVR_NO_FIELD, KVR_NO_FIELD, KVR_SLOT, KVR_NO_FIELD, KVR_SLOT) kIntCount       \
    };                                                                                     \
  }

// Accessors, expanded inside the class body.
#define KVR_SUB_ACCESSORS(number, name, Name, key, Class)              \
  std::shared_ptr<Class> name() const {                                \
    return std::static_pointer_cast<Class>(fields_.subs[Slots::name]); \
  }                                                                    \
  void set##Name(std::shared_ptr<Class> value) {                       \
    fields_.subs[Slots::name] = std::move(value);                      \
  }                                                                    \
  bool has##Name() const {                                             \
    return fields_.subs[Slots::name] != nullptr;                       \
  }

#define KVR_LIST_ACCESSORS(number, list, List, element, Element, key) \
  size_t list##Count() const {                                        \
    return fields_.lists[Slots::list].size();                         \
  }                                                                   \
  const float* list() const {                                         \
    return fields_.lists[Slots::list].elements();                     \
  }                                                                   \
  void clear##List() {                                                \
    PBRepeatedFloatClear(fields_.lists[Slots::list]);                 \
  }                                                                   \
  void add##Element(float value) {                                    \
    PBRepeatedFloatAdd(fields_.lists[Slots::list], value);            \
  }                                                                   \
  float element##AtIndex(size_t index) const {                        \
    return fields_.lists[Slots::list].at(index);                      \
  }                                                                   \
  void set##List(const float* values, size_t count) {                 \
    PBRepeatedFloatSet(fields_.lists[Slots::list], values, count);    \
  }

#define KVR_UINT32_ACCESSORS(number, name, Name, key) \
  uint32_t name() const {                             \
    return fields_.ints[Slots::name];                 \
  }                                                   \
  void set##Name(uint32_t value) {                    \
    fields_.ints[Slots::name] = value;                \
  }

// The setter, which sets the has-bit, and the has-bit's own accessors.
#define KVR_OPTIONAL_ACCESSORS(name, Name, bit, Type, storage)                                \
  void set##Name(Type value) {                                                                \
    fields_.storage[Slots::name] = static_cast<decltype(fields_.storage)::value_type>(value); \
    fields_.setHasBit(bit, true);                                                             \
  }                                                                                           \
  void setHas##Name(bool value) {                                                             \
    fields_.setHasBit(bit, value);                                                            \
  }                                                                                           \
  bool has##Name() const {                                                                    \
    return fields_.hasBit(bit);                                                               \
  }

#define KVR_FLOAT_ACCESSORS(number, name, Name, key, bit) \
  float name() const {                                    \
    return fields_.floats[Slots::name];                   \
  }                                                       \
  KVR_OPTIONAL_ACCESSORS(name, Name, bit, float, floats)

// The getter reads 0 while the bit is clear, whatever value is stored.
#define KVR_ENUM_ACCESSORS(number, name, Name, key, bit)                          \
  int32_t name() const {                                                          \
    return has##Name() ? static_cast<int32_t>(fields_.ints[Slots::name]) : 0;     \
  }                                                                               \
  KVR_OPTIONAL_ACCESSORS(name, Name, bit, int32_t, ints)                          \
  /* The value's name, or "(unknown: %i)". */                                     \
  static std::string name##AsString(int32_t value);                               \
  /* The value named exactly by `string`; 0 for any other string and for none. */ \
  static int32_t StringAs##Name(std::optional<std::string_view> string);

#define KVR_ACCESSORS(FIELDS)                                                              \
  FIELDS(KVR_SUB_ACCESSORS, KVR_LIST_ACCESSORS, KVR_UINT32_ACCESSORS, KVR_FLOAT_ACCESSORS, \
         KVR_ENUM_ACCESSORS)

// Table rows, expanded in the class's source file.
#define KVR_SUB_ROW(number, name, Name, key, Class)                    \
  ::kolvrand::detail::subMessageField(number, Slots::name, #name, key, \
                                      &::kolvrand::detail::makeMessage<Class>),
#define KVR_LIST_ROW(number, list, List, element, Element, key)                                \
  ::kolvrand::detail::field(number, ::kolvrand::detail::FieldKind::RepeatedFloat, Slots::list, \
                            #list, key),
#define KVR_UINT32_ROW(number, name, Name, key) \
  ::kolvrand::detail::field(number, ::kolvrand::detail::FieldKind::Uint32, Slots::name, #name, key),
#define KVR_FLOAT_ROW(number, name, Name, key, bit)                                            \
  ::kolvrand::detail::field(number, ::kolvrand::detail::FieldKind::OptionalFloat, Slots::name, \
                            #name, key, bit),
#define KVR_ENUM_ROW(number, name, Name, key, bit)                                             \
  ::kolvrand::detail::optionalEnumField(number, Slots::name, #name, key, bit, &name##AsString, \
                                        &StringAs##Name),

// Defines Class::table(): the rows of FIELDS, checked at compile time, with
// the field-number index built from them.
#define KVR_DEFINE_FIELD_TABLE(Class, FIELDS)                                                 \
  const ::kolvrand::detail::MessageTable& Class::table() {                                    \
    static constexpr ::kolvrand::detail::FieldDescriptor kRows[] = {                          \
        FIELDS(KVR_SUB_ROW, KVR_LIST_ROW, KVR_UINT32_ROW, KVR_FLOAT_ROW, KVR_ENUM_ROW)};      \
    static_assert(::kolvrand::detail::isValidFieldTable(                                      \
        kRows, Slots::kSubCount, Slots::kListCount, Slots::kFloatCount, Slots::kIntCount));   \
    static constexpr auto kTable =                                                            \
        ::kolvrand::detail::makeFieldTable<::kolvrand::detail::maxFieldNumber(kRows)>(kRows); \
    static constexpr ::kolvrand::detail::MessageTable kView = kTable.view();                  \
    return kView;                                                                             \
  }
