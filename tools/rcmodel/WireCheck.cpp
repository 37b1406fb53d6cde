// SPDX-License-Identifier: MIT
#include "tools/rcmodel/WireCheck.h"

#include <utility>

#include "model/FieldTable.h"
#include "model/OTAParamRC.h"

namespace kolvrand::rcmodel {

namespace {

using detail::FieldDescriptor;
using detail::FieldKind;
using detail::MessageTable;

const char* wireTypeName(uint8_t type) {
  static constexpr const char* kNames[] = {"varint",      "fixed64",    "length-delimited",
                                           "start-group", "end-group",  "fixed32",
                                           "wire type 6", "wire type 7"};
  return kNames[type & 7];
}

const char* kindName(FieldKind kind) {
  switch (kind) {
    case FieldKind::SubMessage:
      return "a message";
    case FieldKind::RepeatedFloat:
      return "a float of its list";
    case FieldKind::OptionalFloat:
      return "a float";
    default:
      return "a varint";
  }
}

std::string fieldName(const FieldDescriptor& d) {
  return "field " + std::to_string(d.number) + " (" + d.key + ")";
}

// Reads the bytes as the daemon's reader does (FieldRead.cpp, PBReaderSkip.cpp)
// and notes where the standard parser would not. It runs on messages the
// daemon decodes, so nothing is cut short; were something, the walk ends.
class Walker {
 public:
  Walker(std::span<const uint8_t> bytes, size_t base, WireProblems* problems)
      : bytes_(bytes), base_(base), problems_(problems) {}

  // The fields from `pos` up to `end`; where the reading stopped (before
  // `end` after an end-group tag).
  size_t fields(const MessageTable& table, size_t pos, size_t end, bool nested = false) {
    uint64_t subsSeen = 0;
    while (pos < end) {
      const size_t at = pos;
      uint64_t tag = 0;
      if (!tagAt(&pos, end, &tag) || stopped()) return end;
      const auto type = static_cast<uint8_t>(tag & 7);
      const auto number = static_cast<uint32_t>(tag >> 3);
      if (type == 4) {
        note(at, "an end-group tag with no group open: the standard parser rejects the file; " +
                     std::string(nested ? "the daemon ends the sub-message there and reads the "
                                        : "the daemon ends the message there and ignores the ") +
                     std::to_string(end - pos) + " bytes after it" +
                     (nested ? " as fields of the enclosing message" : ""));
        return pos;
      }
      const FieldDescriptor* d = table.find(number);
      if (!d) {
        if (!skip(number, type, at, &pos, end) || stopped()) return end;
        continue;
      }
      const bool fits = type == detail::writtenWireType(d->kind) ||
                        (d->kind == FieldKind::RepeatedFloat && type == 2);
      if (type >= 6)
        note(at, fieldName(*d) + " with " + wireTypeName(type) +
                     ", which does not exist: the standard parser rejects the file; the daemon "
                     "reads " +
                     kindName(d->kind));
      else if (!fits)
        diverge(at, fieldName(*d) + " as " + wireTypeName(type) + ", where the schema has " +
                        wireTypeName(detail::writtenWireType(d->kind)) +
                        ": the standard parser keeps it as an unknown field, the daemon reads " +
                        kindName(d->kind));
      if (stopped()) return end;
      switch (d->kind) {
        case FieldKind::SubMessage: {
          if (number < 64 && (subsSeen >> number & 1))
            note(at, fieldName(*d) +
                         " a second time: the standard parser merges it into the first; the "
                         "daemon keeps only this one");
          if (number < 64) subsSeen |= uint64_t{1} << number;
          uint64_t length = 0;
          if (!varint(&pos, end, &length) || length > end - pos) return end;
          // A sub-message that stopped at an end-group tag goes on from there,
          // as the daemon's reader does.
          pos =
              fields(d->makeMessage()->fieldTable(), pos, pos + static_cast<size_t>(length), true);
          break;
        }
        case FieldKind::RepeatedFloat:
          if (type == 2) {
            uint64_t length = 0;
            if (!varint(&pos, end, &length) || length > end - pos) return end;
            pos += static_cast<size_t>(length);
            break;
          }
          [[fallthrough]];
        case FieldKind::OptionalFloat:
          if (end - pos < 4) return end;
          pos += 4;
          break;
        case FieldKind::Uint32:
        case FieldKind::OptionalEnum: {
          uint64_t value = 0;
          if (!varint(&pos, end, &value)) return end;
          break;
        }
      }
    }
    return pos;
  }

 private:
  void note(size_t at, std::string text) { problems_->add(base_ + at, std::move(text)); }

  // A place from which the two parsers read different things: what follows
  // in the same message is not judged, since the standard parser does not
  // see it as the daemon does. The enclosing message goes on after it, as
  // both parsers do.
  void diverge(size_t at, const std::string& text) {
    note(at, text + "; the rest of this message is read otherwise and not checked");
    diverged_ = true;
  }
  bool stopped() { return std::exchange(diverged_, false); }

  // A varint of at most ten bytes; false when cut short.
  bool varint(size_t* pos, size_t end, uint64_t* value, size_t* length = nullptr) {
    const size_t at = *pos;
    *value = 0;
    for (size_t i = 0; i < 10; ++i) {
      if (*pos >= end) return false;
      const uint8_t b = bytes_[(*pos)++];
      *value |= uint64_t{b & 0x7fu} << (7 * i);
      if (b < 0x80) {
        if (length) *length = i + 1;
        return true;
      }
    }
    note(at,
         "a varint whose tenth byte still continues: the standard parser rejects the file; "
         "the daemon reads 0");
    *value = 0;
    if (length) *length = 10;
    return true;
  }

  bool tagAt(size_t* pos, size_t end, uint64_t* tag) {
    const size_t at = *pos;
    size_t length = 0;
    if (!varint(pos, end, tag, &length)) return false;
    if (length > 5)
      note(at, "a tag of " + std::to_string(length) +
                   " bytes: the standard parser reads tags of at most 5 and rejects the file");
    else if (*tag > 0xffffffff)
      diverge(at,
              "a tag wider than 32 bits: the standard parser drops its top bits and reads field " +
                  std::to_string((*tag & 0xffffffff) >> 3) + ", the daemon field " +
                  std::to_string(static_cast<uint32_t>(*tag >> 3)));
    if ((*tag >> 3 & 0xffffffff) == 0 && (*tag & 7) != 4)
      note(at, "field number 0: the standard parser rejects the file; the daemon skips the field");
    return true;
  }

  // An unknown field, a whole group with what it holds included.
  bool skip(uint32_t number, uint8_t type, size_t at, size_t* pos, size_t end) {
    std::vector<uint32_t> open;
    for (;;) {
      uint64_t value = 0;
      switch (type) {
        case 0:
          if (!varint(pos, end, &value)) return false;
          break;
        case 1:
        case 5: {
          const size_t n = type == 1 ? 8 : 4;
          if (end - *pos < n) return false;
          *pos += n;
          break;
        }
        case 2:
          if (!varint(pos, end, &value) || value > end - *pos) return false;
          *pos += static_cast<size_t>(value);
          break;
        case 3:
          open.push_back(number);
          break;
        case 4:
          if (open.empty() || open.back() != number) return false;
          open.pop_back();
          break;
        default:
          note(at, std::string(wireTypeName(type)) +
                       ", which does not exist: the standard parser "
                       "rejects the file");
          return false;
      }
      if (open.empty()) return true;
      at = *pos;
      uint64_t tag = 0;
      if (!tagAt(pos, end, &tag)) return false;
      if (diverged_) return true;
      number = static_cast<uint32_t>(tag >> 3);
      type = static_cast<uint8_t>(tag & 7);
    }
  }

  std::span<const uint8_t> bytes_;
  size_t base_;
  WireProblems* problems_;
  bool diverged_ = false;
};

}  // namespace

void checkWire(std::span<const uint8_t> message, size_t base, WireProblems* problems) {
  static const MessageTable& root = OTAParamRC().fieldTable();
  Walker(message, base, problems).fields(root, 0, message.size());
}

}  // namespace kolvrand::rcmodel
