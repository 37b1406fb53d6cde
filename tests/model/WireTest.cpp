// SPDX-License-Identifier: MIT
// Decoding of valid, unusual and broken input, seen through what the message
// encodes afterwards; the cases are in wire_cases.txt beside this file.
#include <gtest/gtest.h>

#include <fstream>
#include <sstream>
#include <string>

#include "model/OTAParamRC.h"
#include "tests/model/Support.h"

namespace kolvrand {
namespace {

using test::fromHex;

TEST(OTAParamRCWire, ReadsAndWritesAgain) {
  std::ifstream file(KOLVRAND_SOURCE_DIR "/tests/model/wire_cases.txt");
  ASSERT_TRUE(file);
  for (std::string line; std::getline(file, line);) {
    if (line.empty() || line[0] == '#') continue;
    SCOPED_TRACE(line);
    std::istringstream row(line);
    std::string verdict, input, written;
    std::getline(row >> verdict, input, '/');
    std::getline(row, written);
    OTAParamRC m;
    EXPECT_EQ(test::decode(m, fromHex(input)), verdict == "ok");
    EXPECT_EQ(m.data(), fromHex(written));
    EXPECT_EQ(m.encodedSize(), m.data().size());
  }
}

// Groups nest up to a fixed depth, so hostile nesting costs bounded memory;
// an end-group tag with no group open, which a message read never passes on,
// is refused.
TEST(PBReaderSkipValueWithTag, LimitsGroupDepthAndRefusesAStrayEnd) {
  for (size_t depth : {kMaxGroupDepth, kMaxGroupDepth + 1}) {
    std::string hex;
    for (size_t i = 0; i < depth; ++i) hex = "93 03 " + hex + "94 03 ";
    OTAParamRC m;
    EXPECT_EQ(test::decode(m, fromHex(hex + "90 01 07")), depth == kMaxGroupDepth) << depth;
  }
  PBDataReader empty(nullptr, 0);
  EXPECT_FALSE(PBReaderSkipValueWithTag(empty, 7, wire::kEndGroup));
}

}  // namespace
}  // namespace kolvrand
