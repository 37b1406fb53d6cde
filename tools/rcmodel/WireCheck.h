// SPDX-License-Identifier: MIT
// Where the daemon's reader and the standard protocol-buffer parser part ways.
// The daemon reads leniently: a known field by its kind whatever wire type it
// carries, an end-group tag as the end of the message, field number 0 and
// tags or varints of needless length as it finds them. The standard parser
// (libprotobuf, protoc) rejects what such a file holds or reads it otherwise,
// so a model that the daemon loads may not be the model its author sees with
// protoc. This watches the daemon's own reader decode one OTAParamRC (as an
// observer of that reader, so the two cannot disagree) and names every such
// place.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

namespace kolvrand::rcmodel {

struct WireProblem {
  size_t offset;  // in the file
  std::string text;
};

// The problems of a file: the first kShown kept, all counted, so that a file
// of millions of bad messages costs no more memory than one.
struct WireProblems {
  static constexpr size_t kShown = 20;
  std::vector<WireProblem> shown;
  size_t count = 0;

  void add(size_t offset, std::string text) {
    if (count++ < kShown) shown.push_back({offset, std::move(text)});
  }
};

// The places of `message` (an OTAParamRC the daemon decodes, which starts at
// `base` in its file) that the standard parser rejects or reads otherwise.
void checkWire(std::span<const uint8_t> message, size_t base, WireProblems* problems);

}  // namespace kolvrand::rcmodel
