// SPDX-License-Identifier: MIT
// The common body of the message classes: every PBCodable operation, and the
// typed copyTo / copy / mergeFrom, forwarded to the field engine with the
// class's own table. A message class derives from
// GeneratedMessage<Class, Slots>, where Slots is its KVR_FIELD_SLOTS struct, and
// provides `static const detail::MessageTable& table()` and `kClassName`.
#pragma once

#include <memory>
#include <typeinfo>

#include "model/FieldEngine.h"
#include "model/PBCodable.h"

namespace kolvrand::detail {

template <class Derived, class SlotsT>
class GeneratedMessage : public PBCodable {
 public:
  using Slots = SlotsT;

  const char* className() const override { return Derived::kClassName; }
  const MessageTable& fieldTable() const override { return Derived::table(); }

  bool readFrom(PBDataReader& reader) override {
    return readFields(Derived::table(), fields_.view(), reader);
  }
  void writeTo(PBDataWriter& writer) const override {
    writer.reserve(encodedSize());
    writeFields(Derived::table(), fields_.view(), writer);
  }
  size_t encodedSize() const override {
    return encodedFieldsSize(Derived::table(), fields_.view());
  }

  bool isEqual(const PBCodable* other) const override {
    if (!other || typeid(*other) != typeid(*this)) return false;
    return equalFields(Derived::table(), fields_.view(),
                       static_cast<const GeneratedMessage&>(*other).fields_.view());
  }
  uint64_t hash() const override { return hashFields(Derived::table(), fields_.view()); }
  Value dictionaryRepresentation() const override {
    return dictionaryOfFields(Derived::table(), fields_.view());
  }
  bool setFieldsFromDictionary(const Value& dictionary, ValueError* error) override {
    return detail::setFieldsFromDictionary(Derived::table(), fields_.view(), dictionary, error);
  }
  // A new message from its dictionary form; nullptr with *error filled when
  // setFieldsFromDictionary fails.
  static std::shared_ptr<Derived> fromDictionary(const Value& dictionary, ValueError* error) {
    auto message = std::make_shared<Derived>();
    if (!message->setFieldsFromDictionary(dictionary, error)) return nullptr;
    return message;
  }

  // The target shares this message's sub-messages (a later change through
  // either parent shows in both); see Transfer::Copy.
  void copyTo(Derived& target) const {
    transferFields(Derived::table(), fields_.view(), target.GeneratedMessage::fields_.view(),
                   Transfer::Copy);
  }
  // An independent deep copy.
  std::shared_ptr<Derived> copy() const {
    auto result = std::make_shared<Derived>();
    transferFields(Derived::table(), fields_.view(), result->GeneratedMessage::fields_.view(),
                   Transfer::DeepCopy);
    return result;
  }
  void mergeFrom(const Derived& source) {
    transferFields(Derived::table(), source.GeneratedMessage::fields_.view(), fields_.view(),
                   Transfer::Merge);
  }

  std::shared_ptr<PBCodable> copyMessage() const override { return copy(); }
  void mergeFromMessage(const PBCodable& source) override {
    mergeFrom(static_cast<const Derived&>(source));
  }

 protected:
  FieldStorage<Slots::kSubCount, Slots::kListCount, Slots::kFloatCount, Slots::kIntCount> fields_;
};

}  // namespace kolvrand::detail
