// SPDX-License-Identifier: MIT
// Feeds arbitrary bytes to the model-file stream reader, the way the daemon
// reads a model file, and turns the first message into the kernel record.
// A stream that reads must survive being written out and read again, and a
// refused one must say why.
#include <algorithm>
#include <cstring>

#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/KextBatteryModelSources.h"
#include "pipeline/PBStreamReader.h"
#include "pipeline/PBStreamWriter.h"

using namespace kolvrand;

static std::shared_ptr<BatteryModelDataHandler> handler;

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  fuzz::quietLogs();
  handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create("com.tesvar.kolvrand", "batteryModelDataHandling"));
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  NSError error;
  auto messages = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>({data, size}, &error);
  fuzz::check(messages || !error.localizedDescription.empty());
  fuzz::check(!messages || messages->empty() == (size == 0));
  if (!messages) return 0;

  // The first messages, written out as a stream, read back to the same bytes.
  // Only the first: an input of thousands of empty messages would otherwise
  // spend the run writing and rereading them.
  const size_t checked = std::min<size_t>(messages->size(), 16);
  const std::vector<uint8_t> rewritten =
      PBStreamWriter::dataForMessages<OTAParamRC>({messages->data(), checked});
  auto again = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(std::span(rewritten), &error);
  fuzz::check(again && again->size() == checked);
  for (size_t i = 0; i < checked; ++i) fuzz::check((*again)[i]->data() == (*messages)[i]->data());

  if (messages->empty()) return 0;
  // A model that fills the record goes on to the builder, whose copies the
  // count checks must keep in bounds (AddressSanitizer watches them). Of the others, which the
  // builder only refuses, line by line (the unit tests pin those lines), one in eight goes too:
  // formatting the refusals would otherwise take most of the run.
  const OTAParamRC& model = *messages->front();
  const bool fills = std::ranges::all_of(checkKextLists(model), &KextListCheck::fills);
  if (!fills && size % 8 != 0) return 0;

  auto record = handler->createKextModelFromProtobufModel(&model);
  fuzz::check(static_cast<bool>(record) == fills);
  if (!record) return 0;
  // The record depends on the model alone: the reread model gives the same bytes.
  auto second = handler->createKextModelFromProtobufModel(again->front().get());
  fuzz::check(second && std::memcmp(record.get(), second.get(), sizeof(KextBatteryModel)) == 0);
  fuzz::check(record->chemID == model.chemID());
  return 0;
}
