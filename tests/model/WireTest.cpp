// Decoding of valid, unusual and broken input, seen through what the message
// encodes afterwards (its exact bytes show every value and has-bit it holds).
#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "model/OTAParamRC.h"
#include "tests/model/Support.h"

namespace kolvrand {
namespace {

using test::decode;
using test::fromHex;
using test::toHex;

TEST(OTAParamRCWire, ReadsAndWritesAgain) {
  struct Case {
    const char* name;
    const char* hex;
    bool ok;
    const char* written;
  };
  const Case cases[] = {
      {"empty input", "", true, "90 01 00"},
      {"varint wider than 32 bits keeps the low bits", "90 01 85 80 80 80 10", true, "90 01 05"},
      {"ten-byte varint with top bit still set is 0 and reading goes on",
       "90 01 FF FF FF FF FF FF FF FF FF FF E8 02 01", true, "90 01 00 E8 02 01"},
      {"negative mLBConfig is a ten-byte varint", "E8 02 FF FF FF FF FF FF FF FF FF 01", true,
       "90 01 00 E8 02 FF FF FF FF FF FF FF FF FF 01"},
      {"unnamed mLBConfig", "E8 02 07", true, "90 01 00 E8 02 07"},
      {"field number compared on its low 32 bits", "90 81 80 80 80 01 09", true, "90 01 09"},
      {"float field sent as varint is read as four bytes", "A8 01 00 00 80 3F", true,
       "90 01 00 AD 01 00 00 80 3F"},
      {"varint field sent as fixed32 is read as varint", "95 01 05 E8 02 01", true,
       "90 01 05 E8 02 01"},
      {"last sub-message occurrence wins", "0A 05 0D 00 00 80 3F 0A 05 0D 00 00 00 40", true,
       "0A 05 0D 00 00 00 40 90 01 00"},
      {"packed and unpacked accumulate in order",
       "4A 08 00 00 80 3F 00 00 00 40 4D 00 00 40 40 4A 00 4D 00 00 80 40", true,
       "4D 00 00 80 3F 4D 00 00 00 40 4D 00 00 40 40 4D 00 00 80 40 90 01 00"},
      {"unknown fields of every wire type are skipped",
       "90 03 96 01 91 03 01 02 03 04 05 06 07 08 92 03 02 AA BB 93 03 08 01 94 03 "
       "95 03 01 02 03 04 00 05 90 01 07",
       true, "90 01 07"},
      {"over-long tag is field 0 and skipped as a varint",
       "FF FF FF FF FF FF FF FF FF FF 05 90 01 07", true, "90 01 07"},
      {"end-group at top level ends the read", "90 01 07 0C 90 01 08", true, "90 01 07"},
      {"truncated tag", "90", false, "90 01 00"},
      {"truncated varint leaves 0 and the has-bit", "90 01 07 E8 02 81", false,
       "90 01 07 E8 02 00"},
      {"truncated float leaves 0.0 and the has-bit", "90 01 07 AD 01 00 00", false,
       "90 01 07 AD 01 00 00 00 00"},
      {"packed run not a multiple of 4 appends 0.0", "4A 06 00 00 80 3F 00 00", false,
       "4D 00 00 80 3F 4D 00 00 00 00 90 01 00"},
      {"unpacked run cut short appends 0.0", "9D 01 00 00 80 3F 9D 01 00 00 00 40 9D 01 00", false,
       "90 01 00 9D 01 00 00 80 3F 9D 01 00 00 00 40 9D 01 00 00 00 00"},
      {"packed run past the end", "4A 09 00 00 80 3F", false, "90 01 00"},
      {"sub-message length past the end leaves it present and empty", "8A 01 05 00", false,
       "8A 01 00 90 01 00"},
      {"failed sub-message keeps what it read", "0A 07 0D 00 00 80 3F 15 00", false,
       "0A 0A 0D 00 00 80 3F 15 00 00 00 00 90 01 00"},
      {"wire type 6 on an unknown field", "96 03 00", false, "90 01 00"},
      {"unknown length-delimited past the end", "92 03 05 00", false, "90 01 00"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    OTAParamRC m;
    EXPECT_EQ(decode(m, fromHex(c.hex)), c.ok);
    EXPECT_EQ(toHex(m.data()), c.written);
    EXPECT_EQ(m.encodedSize(), m.data().size());
  }
  // A cleared sub-message and values behind cleared has-bits are not written.
  OTAParamRC m;
  m.setR0(std::make_shared<OTAResistanceData>());
  m.setR0(nullptr);
  m.setMLBConfig(1);
  m.setHasMLBConfig(false);
  m.setMaxRdcRatio(2.0f);
  m.setHasMaxRdcRatio(false);
  EXPECT_EQ(toHex(m.data()), "90 01 00");
}

TEST(PBReaderSkipValueWithTag, SkipsWhatItCanAndRefusesTheRest) {
  struct Case {
    const char* name;
    uint8_t wireType;
    const char* hex;  // the value after a tag for field 7
    bool ok;
    size_t end;
  };
  const Case cases[] = {
      {"varint", 0, "96 01 FF", true, 2},
      {"truncated varint", 0, "96", false, 1},
      {"fixed64", 1, "01 02 03 04 05 06 07 08", true, 8},
      {"truncated fixed64", 1, "01 02 03 04 05 06 07", false, 0},
      {"length-delimited", 2, "03 AA BB CC DD", true, 4},
      {"length past the end", 2, "05 AA", false, 1},
      {"nested groups", 3, "08 01 3B 10 02 3C 3C 00", true, 7},
      {"group closed by another field", 3, "08 01 44", false, 3},
      {"group never closed", 3, "08 01", false, 2},
      {"stray end-group", 4, "", false, 0},
      {"fixed32", 5, "01 02 03 04", true, 4},
      {"truncated fixed32", 5, "01 02 03", false, 0},
      {"wire type 6", 6, "00", false, 0},
      {"wire type 7", 7, "00", false, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::vector<uint8_t> bytes = fromHex(c.hex);
    PBDataReader reader(bytes.data(), bytes.size());
    EXPECT_EQ(PBReaderSkipValueWithTag(reader, 7, c.wireType), c.ok);
    EXPECT_EQ(reader.position(), c.end);
  }
}

}  // namespace
}  // namespace kolvrand
