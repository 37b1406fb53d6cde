// SPDX-License-Identifier: MIT
// Where each list of the record comes from in the model: one table shared by
// the record builder and by the tools that check a model against the record.
#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <vector>

namespace kolvrand {

class OTAParamRC;
class OTAResistanceData;

// Fields are named by the dictionary keys model authors write ("R0",
// "resistance25C", "gridOCV").

// A list of the model itself, carried at `offset` as its first `count` elements.
struct KextListSource {
  const char* field;
  size_t offset;
  size_t count;
  std::span<const float> (*elements)(const OTAParamRC&);
};

// A resistance table, carried as a KextResistanceTable at `offset`.
struct KextTableSource {
  const char* field;
  size_t offset;
  const OTAResistanceData* (*table)(const OTAParamRC&);
};

// The lists of a resistance table, in record order.
struct KextTableListSource {
  const char* field;
  size_t offset;  // within the KextResistanceTable
  size_t count;
  std::span<const float> (*elements)(const OTAResistanceData&);
};

std::span<const KextListSource> kextListSources();
std::span<const KextTableSource> kextTableSources();
std::span<const KextTableListSource> kextTableListSources();

// One list the record carries, against what the model holds; or a resistance
// table the model lacks (`list` null).
struct KextListCheck {
  const char* table;  // the resistance table's key; null for a list of the model itself
  const char* list;
  size_t held;
  size_t carried;

  bool fills() const { return list && held >= carried; }
  // "R0.resistance25C", "gridOCV", or "R2" for a missing table.
  std::string name() const;
};

// Every list of the record in record order, a missing table once in place of
// its lists. The model fills the record when every entry fills().
std::vector<KextListCheck> checkKextLists(const OTAParamRC& model);

}  // namespace kolvrand
