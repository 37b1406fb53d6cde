// SPDX-License-Identifier: MIT
#include "tools/rcmodel/WireCheck.h"

#include <vector>

#include "model/FieldTable.h"
#include "model/OTAParamRC.h"

namespace kolvrand::rcmodel {

namespace {

using detail::FieldDescriptor;
using detail::FieldKind;

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

// Watches the daemon's own reader decode a message and notes where the
// standard parser would not read what it reads.
class Observer final : public WireObserver {
 public:
  Observer(size_t base, WireProblems* problems) : base_(base), problems_(problems) {}

  void beginMessage() override { subsSeen_.push_back(0); }
  void endMessage() override {
    subsSeen_.pop_back();
    if (subsSeen_.size() < mutedAt_) mutedAt_ = 0;
  }

  void tag(size_t at, uint64_t tag, size_t size) override {
    lastTag_ = at;
    bool diverged = false;
    if (size > 5)
      note(at, "a tag of " + std::to_string(size) +
                   " bytes: the standard parser reads tags of at most 5 and rejects the file");
    else if (tag > 0xffffffff)
      diverged = diverge(
          at, "a tag wider than 32 bits: the standard parser drops its top bits and reads field " +
                  std::to_string((tag & 0xffffffff) >> 3) + ", the daemon field " +
                  std::to_string(static_cast<uint32_t>(tag >> 3)));
    if ((tag >> 3 & 0xffffffff) == 0 && (tag & 7) != 4)
      note(at, "field number 0: the standard parser rejects the file; the daemon skips the field");
    if (diverged) mute();
  }

  void overLongVarint(size_t at) override {
    note(at,
         "a varint whose tenth byte still continues: the standard parser rejects the file; "
         "the daemon reads 0");
  }

  void endGroup(size_t after) override {
    const bool nested = subsSeen_.size() > 1;
    note(lastTag_, "an end-group tag with no group open: the standard parser rejects the file; " +
                       std::string(nested ? "the daemon ends the sub-message there and reads the "
                                          : "the daemon ends the message there and ignores the ") +
                       std::to_string(after) + " bytes after it" +
                       (nested ? " as fields of the enclosing message" : ""));
  }

  void field(const FieldDescriptor& d, uint8_t type) override {
    const bool fits = type == detail::writtenWireType(d.kind) ||
                      (d.kind == FieldKind::RepeatedFloat && type == wire::kLengthDelimited);
    if (type >= 6) {
      note(lastTag_, fieldName(d) + " with " + wireTypeName(type) +
                         ", which does not exist: the standard parser rejects the file; the "
                         "daemon reads " +
                         kindName(d.kind));
    } else if (!fits) {
      diverge(lastTag_, fieldName(d) + " as " + wireTypeName(type) + ", where the schema has " +
                            wireTypeName(detail::writtenWireType(d.kind)) +
                            ": the standard parser keeps it as an unknown field, the daemon "
                            "reads " +
                            kindName(d.kind));
      mute();
      return;
    }
    if (d.kind != FieldKind::SubMessage || d.number >= 64 || subsSeen_.empty()) return;
    uint64_t& seen = subsSeen_.back();
    if (seen >> d.number & 1)
      note(lastTag_, fieldName(d) +
                         " a second time: the standard parser merges it into the first; the "
                         "daemon keeps only this one");
    seen |= uint64_t{1} << d.number;
  }

  void noSuchWireType(uint8_t type) override {
    note(lastTag_, std::string(wireTypeName(type)) +
                       ", which does not exist: the standard parser rejects the file");
  }

 private:
  void note(size_t at, std::string text) {
    if (!mutedAt_) problems_->add(base_ + at, std::move(text));
  }
  // A place from which the two parsers read different things: what follows
  // in the same message is not judged, since the standard parser does not
  // see it as the daemon does. The enclosing message goes on after it, as
  // both parsers do.
  bool diverge(size_t at, const std::string& text) {
    note(at, text + "; the rest of this message is read otherwise and not checked");
    return true;
  }
  void mute() {
    if (!mutedAt_) mutedAt_ = subsSeen_.size();
  }

  size_t base_;
  WireProblems* problems_;
  std::vector<uint64_t> subsSeen_;  // per open message, the sub-message fields met
  size_t lastTag_ = 0;
  size_t mutedAt_ = 0;  // the depth of the message whose rest is not judged, or 0
};

}  // namespace

void checkWire(std::span<const uint8_t> message, size_t base, WireProblems* problems) {
  if (message.empty()) return;  // nothing to read, and a file may hold millions
  Observer observer(base, problems);
  PBDataReader reader(message.data(), message.size());
  reader.setObserver(&observer);
  OTAParamRC().readFrom(reader);
}

}  // namespace kolvrand::rcmodel
