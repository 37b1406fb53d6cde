// SPDX-License-Identifier: MIT
// Synthetic but plausible battery models, made reproducibly from a chem ID:
// the same chem ID gives the same bytes on every machine.
#pragma once

#include <cstdint>
#include <memory>

namespace kolvrand {

class OTAParamRC;

// A full-size model: every list at least as long as the kernel record carries,
// all 17 resistance tables and the board-path resistances. `variant` 'b' is
// the second cell of a chemistry that comes from two makers (the daemon tells
// them apart by the battery's serial number and loads CHEMIDa or CHEMIDb):
// its own jitter and resistances some 8 % higher. Any other variant, 'a'
// included, is the chemistry's first cell.
std::shared_ptr<OTAParamRC> makeExampleModel(uint32_t chemID, char variant = 0);

}  // namespace kolvrand
