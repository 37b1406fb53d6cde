// SPDX-License-Identifier: MIT
// The message operations, written once over a field table and the message's
// storage. Fields are visited in table order (ascending field number).
#pragma once

#include <cstddef>
#include <cstdint>

#include "base/Value.h"
#include "model/FieldStorage.h"
#include "model/FieldTable.h"
#include "model/PBDataReader.h"
#include "model/PBDataWriter.h"

namespace kolvrand {
struct ValueError;
}

namespace kolvrand::detail {

// The read function: decodes fields up to the reader's limit. Known fields are
// decoded by their kind whatever wire type they carry (only a repeated field
// looks at it, to tell a packed run); unknown ones are skipped. Ends at the
// limit, at an error, or at an end-group tag; true when no error was set.
bool readFields(const MessageTable& table, MutableFields fields, PBDataReader& reader);

void writeFields(const MessageTable& table, ConstFields fields, PBDataWriter& writer);
size_t encodedFieldsSize(const MessageTable& table, ConstFields fields);

enum class Transfer {
  // copyTo: the target shares the source's sub-messages and takes its
  // non-empty lists, chemID-like values and set optional values; the rest stays.
  Copy,
  // Into a new message: an independent tree of exactly the source's present fields.
  DeepCopy,
  // mergeFrom: sub-messages merged recursively (or shared when the target has
  // none), lists appended, set values overwritten.
  Merge,
};
void transferFields(const MessageTable& table, ConstFields from, MutableFields to, Transfer how);

bool equalFields(const MessageTable& table, ConstFields a, ConstFields b);
uint64_t hashFields(const MessageTable& table, ConstFields fields);
Value dictionaryOfFields(const MessageTable& table, ConstFields fields);
// The reverse of dictionaryOfFields, by the same keys and kinds: floats from
// any number that rounds to a finite float (or is NaN or infinite already),
// chemID-like fields from integral numbers in range, enums from their names,
// "(unknown: N)" or a 32-bit integer.
bool setFieldsFromDictionary(const MessageTable& table, MutableFields fields,
                             const Value& dictionary, ValueError* error);

}  // namespace kolvrand::detail
