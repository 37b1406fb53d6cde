// Synthetic but plausible battery models, made reproducibly from a chem ID:
// the same chem ID gives the same bytes on every machine.
#pragma once

#include <cstdint>
#include <memory>

namespace kolvrand {

class OTAParamRC;

// A full-size model: every list at least as long as the kernel record carries,
// all 17 resistance tables and the board-path resistances.
std::shared_ptr<OTAParamRC> makeExampleModel(uint32_t chemID);

}  // namespace kolvrand
