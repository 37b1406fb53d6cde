// SPDX-License-Identifier: MIT
#include "model/FieldEngine.h"
#include "model/FloatHash.h"
#include "model/PBCodable.h"

namespace kolvrand::detail {

namespace {

int32_t asInt32(uint32_t stored) {
  return static_cast<int32_t>(stored);
}

}  // namespace

void transferFields(const MessageTable& table, ConstFields from, MutableFields to, Transfer how) {
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    switch (d->kind) {
      case FieldKind::SubMessage: {
        const auto& source = from.subs[d->slot];
        if (!source) break;
        auto& target = to.subs[d->slot];
        if (how == Transfer::DeepCopy)
          target = source->copyMessage();
        else if (how == Transfer::Merge && target)
          // Merging into a present sub-message changes that object in place,
          // so every parent sharing it sees the change.
          target->mergeFromMessage(*source);
        else
          target = source;
        break;
      }
      case FieldKind::RepeatedFloat:
        if (how == Transfer::Merge)
          to.lists[d->slot].append(from.lists[d->slot]);
        else if (how == Transfer::DeepCopy || !from.lists[d->slot].empty())
          PBRepeatedFloatCopy(to.lists[d->slot], from.lists[d->slot]);
        break;
      case FieldKind::Uint32:
        to.ints[d->slot] = from.ints[d->slot];
        break;
      case FieldKind::OptionalFloat:
      case FieldKind::OptionalEnum:
        // A set value is copied with its bit; a clear bit leaves the target's.
        if (!(from.has & d->hasMask())) break;
        if (d->kind == FieldKind::OptionalFloat)
          to.floats[d->slot] = from.floats[d->slot];
        else
          to.ints[d->slot] = from.ints[d->slot];
        *to.has |= d->hasMask();
        break;
    }
  }
}

bool equalFields(const MessageTable& table, ConstFields a, ConstFields b) {
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    switch (d->kind) {
      case FieldKind::SubMessage: {
        const auto& x = a.subs[d->slot];
        const auto& y = b.subs[d->slot];
        if (x ? !x->isEqual(y.get()) : y != nullptr) return false;
        break;
      }
      case FieldKind::RepeatedFloat:
        if (!PBRepeatedFloatIsEqual(a.lists[d->slot], b.lists[d->slot])) return false;
        break;
      case FieldKind::Uint32:
        if (a.ints[d->slot] != b.ints[d->slot]) return false;
        break;
      case FieldKind::OptionalFloat:
      case FieldKind::OptionalEnum: {
        // Values behind clear bits are not looked at.
        const bool set = a.has & d->hasMask();
        if (set != static_cast<bool>(b.has & d->hasMask())) return false;
        if (!set) break;
        if (d->kind == FieldKind::OptionalFloat ? a.floats[d->slot] != b.floats[d->slot]
                                                : a.ints[d->slot] != b.ints[d->slot])
          return false;
        break;
      }
    }
  }
  return true;
}

uint64_t hashFields(const MessageTable& table, ConstFields fields) {
  uint64_t hash = 0;
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    switch (d->kind) {
      case FieldKind::SubMessage:
        if (const auto& message = fields.subs[d->slot]) hash ^= message->hash();
        break;
      case FieldKind::RepeatedFloat:
        hash ^= PBRepeatedFloatHash(fields.lists[d->slot]);
        break;
      case FieldKind::Uint32:
        hash ^= uint64_t{fields.ints[d->slot]} * kPBHashMultiplier;
        break;
      case FieldKind::OptionalFloat:
        if (fields.has & d->hasMask()) hash ^= PBFloatHash(fields.floats[d->slot]);
        break;
      case FieldKind::OptionalEnum:
        if (fields.has & d->hasMask())
          hash ^= static_cast<uint64_t>(int64_t{asInt32(fields.ints[d->slot])}) * kPBHashMultiplier;
        break;
    }
  }
  return hash;
}

Value dictionaryOfFields(const MessageTable& table, ConstFields fields) {
  Dictionary dictionary;
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    switch (d->kind) {
      case FieldKind::SubMessage:
        if (const auto& message = fields.subs[d->slot])
          dictionary.set(d->key, message->dictionaryRepresentation());
        break;
      case FieldKind::RepeatedFloat:
        dictionary.set(d->key, PBRepeatedFloatNSArray(fields.lists[d->slot]));
        break;
      case FieldKind::Uint32:
        dictionary.set(d->key, Number::fromUnsigned(fields.ints[d->slot]));
        break;
      case FieldKind::OptionalFloat:
        if (fields.has & d->hasMask())
          dictionary.set(d->key, Number::fromFloat(fields.floats[d->slot]));
        break;
      case FieldKind::OptionalEnum:
        if (fields.has & d->hasMask())
          dictionary.set(d->key, d->enumName(asInt32(fields.ints[d->slot])));
        break;
    }
  }
  return Value(std::move(dictionary));
}

}  // namespace kolvrand::detail
