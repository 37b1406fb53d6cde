// SPDX-License-Identifier: MIT
// The dictionary form of a libprotobuf message by the rules of ours: lists
// always, chemID always (it has no presence in ours), every other field when
// set. Shared by the oracle test and the differential fuzz target.
#pragma once

#include <utility>

#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>

#include "model/OTAParamRC.h"

namespace kolvrand::test {

inline Value oracleDictionary(const google::protobuf::Message& m) {
  using google::protobuf::FieldDescriptor;
  const auto* reflection = m.GetReflection();
  const auto* descriptor = m.GetDescriptor();
  Dictionary d;
  for (int i = 0; i < descriptor->field_count(); ++i) {
    const FieldDescriptor* f = descriptor->field(i);
    if (f->is_repeated()) {
      Array a;
      for (int k = 0; k < reflection->FieldSize(m, f); ++k)
        a.emplace_back(Number::fromFloat(reflection->GetRepeatedFloat(m, f, k)));
      d.set(f->name(), std::move(a));
    } else if (f->cpp_type() == FieldDescriptor::CPPTYPE_UINT32) {
      d.set(f->name(), Number::fromUnsigned(reflection->GetUInt32(m, f)));
    } else if (reflection->HasField(m, f)) {
      switch (f->cpp_type()) {
        case FieldDescriptor::CPPTYPE_MESSAGE:
          d.set(f->name(), oracleDictionary(reflection->GetMessage(m, f)));
          break;
        case FieldDescriptor::CPPTYPE_FLOAT:
          d.set(f->name(), Number::fromFloat(reflection->GetFloat(m, f)));
          break;
        case FieldDescriptor::CPPTYPE_ENUM:
          d.set(f->name(), OTAParamRC::mLBConfigAsString(reflection->GetEnumValue(m, f)));
          break;
        default:
          // A field type the schema does not use: never equal to ours.
          d.set(f->name(), Value(std::string("unexpected type ") + f->type_name()));
      }
    }
  }
  return d;
}

// Both readings with the MLBConfig left out when ours holds a value the enum
// does not name: our reader carries it, libprotobuf keeps it apart as an
// unknown field (and shows an earlier named value, if any).
inline std::pair<Value, Value> comparableReadings(const Value& ours, const Value& oracle) {
  const Value* named = ours.asDictionary()->find("MLBConfig");
  const bool unnamed = named && named->asString()->starts_with("(unknown");
  const auto compared = [&](const Value& v) {
    Dictionary d;
    for (const auto& [key, value] : *v.asDictionary())
      if (key != "MLBConfig" || !unnamed) d.set(key, value);
    return Value(d);
  };
  return {compared(ours), compared(oracle)};
}

}  // namespace kolvrand::test
