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
  virtual bool setFieldsFromDictionary(const Value& dictionary, ValueError* error) = 0;
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
