// SPDX-License-Identifier: MIT
// The base of every message class: what a message can do without its caller
// knowing which message it is.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "base/Value.h"
#include "model/PBDataReader.h"
#include "model/PBDataWriter.h"

namespace kolvrand {

namespace detail {
struct MessageTable;
}

// Why a dictionary could not be taken into a message, and where: `path` is the
// keys from the message down, joined by '.', with list positions as "[i]"
// ("R0.resistance25C[3]"); empty for the dictionary itself.
struct DictionaryError {
  std::string path;
  std::string reason;
  // The number the reason names, as its description reads ("4294967296"),
  // so that a caller holding the text it came from can show it as written.
  std::string number;
};

// A key as DictionaryError paths show it: as it is when it is a name, else in
// brackets as a JSON string (["a.b"], ["\u0000"]), so that no key reads as
// two and none cuts a message short.
std::string dictionaryPathKey(const std::string& key);

class PBCodable {
 public:
  PBCodable() = default;
  virtual ~PBCodable() = default;
  // Messages are shared by std::shared_ptr and duplicated with copy(), never
  // copied as C++ values.
  PBCodable(const PBCodable&) = delete;
  PBCodable& operator=(const PBCodable&) = delete;

  virtual const char* className() const = 0;
  // The rows of the message's fields, for tools that walk its encoding.
  virtual const detail::MessageTable& fieldTable() const = 0;

  // Decodes fields from the reader's position up to its limit into this
  // message; true when the reader's error flag is clear at the end.
  virtual bool readFrom(PBDataReader& reader) = 0;
  virtual void writeTo(PBDataWriter& writer) const = 0;
  // The number of bytes writeTo() appends.
  virtual size_t encodedSize() const = 0;

  // False unless `other` is of exactly this message's class.
  virtual bool isEqual(const PBCodable* other) const = 0;
  // Equal messages hash alike.
  virtual uint64_t hash() const = 0;
  virtual Value dictionaryRepresentation() const = 0;
  // The reverse of dictionaryRepresentation(): each key sets its field (a
  // list or sub-message is replaced whole); fields whose keys are absent stay
  // as they are. An unknown key, a value of the wrong type or one out of range
  // fails with *error filled; the message is then partly set and should be
  // dropped.
  virtual bool setFieldsFromDictionary(const Value& dictionary, DictionaryError* error) = 0;
  // The base description ("<Class: 0x...>"), a space, and the dictionary.
  virtual std::string description() const;

  // The type-erased forms of copy() and mergeFrom(), which work on a parent's
  // sub-message field without knowing its class. The source of a merge must
  // be of this message's class.
  virtual std::shared_ptr<PBCodable> copyMessage() const = 0;
  virtual void mergeFromMessage(const PBCodable& source) = 0;

  // The encoded message in a new buffer.
  std::vector<uint8_t> data() const;

 protected:
  std::string baseDescription() const;
};

}  // namespace kolvrand
