// SPDX-License-Identifier: MIT
#include <bit>
#include <cstring>

#if defined(__x86_64__)
#include <immintrin.h>
#endif

#include "model/FieldEngine.h"
#include "model/PBCodable.h"

namespace kolvrand::detail {

namespace {

// Room for `count` more elements of `list`: a list with no array yet takes it
// from the reader's shared array, so that decoding allocates once for all
// lists; any other list grows its own.
inline float* appendRoom(PBDataReader& reader, MutableFields& fields, PBRepeatedFloat& list,
                         size_t count) {
  if (list.capacity() == 0 && fields.lentFloats) {
    if (float* room = reader.takeFloats(count, *fields.lentFloats)) list.lend(room, count);
  }
  return list.appendUninitialized(count);
}

// A packed run; the reader's limit is narrowed to it. Whole floats are taken
// in one copy (the run's length was checked against the bytes that remain, so
// the list grows by at most remaining() / 4); a tail of 1 to 3 bytes appends
// 0.0 and sets the error flag.
void readPackedRun(PBDataReader& reader, MutableFields& fields, PBRepeatedFloat& list) {
  const size_t whole = reader.remaining() / 4;
  if (whole) {
    float* out = appendRoom(reader, fields, list, whole);
    if constexpr (std::endian::native == std::endian::little) {
      std::memcpy(out, reader.cursor(), whole * 4);
    } else {
      for (size_t i = 0; i < whole; ++i) out[i] = wire::loadFloat(reader.cursor() + 4 * i);
    }
    reader.advance(whole * 4);
  }
  if (!reader.isAtEnd()) list.add(reader.readFloat());
}

// Entries of an unpacked run: TagSize tag bytes and a fixed32 each. The tags
// of two neighbouring entries lie within eight bytes, so four entries are
// tested with two loads and one branch.
template <size_t TagSize>
struct Run {
  static constexpr size_t kStride = TagSize + 4;
  static_assert(kStride + TagSize <= 8 && 2 * kStride >= 8);

  explicit Run(const uint8_t* tagBytes) : tag(tagBytes) {
    uint8_t maskBytes[8] = {}, pairBytes[8] = {};
    for (size_t k = 0; k < TagSize; ++k) {
      maskBytes[k] = maskBytes[kStride + k] = 0xff;
      pairBytes[k] = pairBytes[kStride + k] = tag[k];
    }
    std::memcpy(&mask, maskBytes, 8);
    std::memcpy(&pair, pairBytes, 8);
  }

  // Whether entries i .. i+3 at p all carry the tag; they must be whole.
  bool fourSame(const uint8_t* p, size_t i) const {
    uint64_t a, b;
    std::memcpy(&a, p + i * kStride, 8);
    std::memcpy(&b, p + (i + 2) * kStride, 8);
    return (((a & mask) ^ pair) | ((b & mask) ^ pair)) == 0;
  }
  bool same(const uint8_t* p, size_t i) const {
    return std::memcmp(p + i * kStride, tag, TagSize) == 0;
  }
  static float value(const uint8_t* p, size_t i) {
    return wire::loadFloat(p + i * kStride + TagSize);
  }

  // The number of entries, at most `fit`, at p that carry the tag.
  size_t count(const uint8_t* p, size_t fit) const {
    size_t n = 0;
    while (n + 4 <= fit && fourSame(p, n)) n += 4;
    while (n < fit && same(p, n)) ++n;
    return n;
  }
  // The values of the first n entries at p.
  static void copy(float* out, const uint8_t* p, size_t n) {
    size_t i = 0;
    for (; i + 4 <= n; i += 4) {
      out[i] = value(p, i);
      out[i + 1] = value(p, i + 1);
      out[i + 2] = value(p, i + 2);
      out[i + 3] = value(p, i + 3);
    }
    for (; i < n; ++i) out[i] = value(p, i);
  }
  // count() and copy() in one pass: out has room for `fit` values.
  size_t countAndCopy(float* out, const uint8_t* p, size_t fit) const {
    size_t n = 0;
    for (; n + 4 <= fit; n += 4) {
      // Whole entries, so copying before the test is harmless.
      out[n] = value(p, n);
      out[n + 1] = value(p, n + 1);
      out[n + 2] = value(p, n + 2);
      out[n + 3] = value(p, n + 3);
      if (!fourSame(p, n)) break;
    }
    for (; n < fit && same(p, n); ++n) out[n] = value(p, n);
    return n;
  }

  const uint8_t* tag;
  uint64_t mask, pair;
};

#if defined(__x86_64__)
// One-byte tags with the SSSE3 byte shuffle: sixteen bytes at an entry hold
// three whole entries and the next entry's tag, so three values are tested
// and gathered per load. Needs the first `fit` entries at p whole and room
// for `fit` values at out.
__attribute__((target("ssse3"))) size_t countAndCopyShuffled(float* out, const uint8_t* p,
                                                             uint8_t tag, size_t fit) {
  const __m128i gather = _mm_setr_epi8(1, 2, 3, 4, 6, 7, 8, 9, 11, 12, 13, 14, -1, -1, -1, -1);
  const __m128i tags = _mm_set1_epi8(static_cast<char>(tag));
  constexpr int kTagBits = 1 << 0 | 1 << 5 | 1 << 10;
  size_t n = 0;
  // Entries n .. n+5 are whole and n+6's tag follows, so both loads read
  // inside the run, and the four values stored per load fit in out.
  while (n + 7 <= fit) {
    const __m128i a = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 5 * n));
    const __m128i b = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 5 * n + 15));
    const int same = _mm_movemask_epi8(_mm_cmpeq_epi8(a, tags)) &
                     _mm_movemask_epi8(_mm_cmpeq_epi8(b, tags)) & kTagBits;
    if (same != kTagBits) break;
    _mm_storeu_si128(reinterpret_cast<__m128i*>(out + n), _mm_shuffle_epi8(a, gather));
    _mm_storeu_si128(reinterpret_cast<__m128i*>(out + n + 3), _mm_shuffle_epi8(b, gather));
    n += 6;
  }
  for (; n < fit && p[5 * n] == tag; ++n) out[n] = wire::loadFloat(p + 5 * n + 1);
  return n;
}

// Two-byte tags: sixteen bytes at an entry hold two whole entries.
__attribute__((target("ssse3"))) size_t countAndCopyShuffled2(float* out, const uint8_t* p,
                                                              const uint8_t* tag, size_t fit) {
  const __m128i gather = _mm_setr_epi8(2, 3, 4, 5, 8, 9, 10, 11, -1, -1, -1, -1, -1, -1, -1, -1);
  const char t0 = static_cast<char>(tag[0]), t1 = static_cast<char>(tag[1]);
  const __m128i tags = _mm_setr_epi8(t0, t1, 0, 0, 0, 0, t0, t1, 0, 0, 0, 0, 0, 0, 0, 0);
  constexpr int kTagBits = 1 << 0 | 1 << 1 | 1 << 6 | 1 << 7;
  size_t n = 0;
  // Entries n .. n+4 are whole, so both loads read inside the run.
  while (n + 5 <= fit) {
    const __m128i a = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 6 * n));
    const __m128i b = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 6 * n + 12));
    const int same = _mm_movemask_epi8(_mm_cmpeq_epi8(a, tags)) &
                     _mm_movemask_epi8(_mm_cmpeq_epi8(b, tags)) & kTagBits;
    if (same != kTagBits) break;
    _mm_storel_epi64(reinterpret_cast<__m128i*>(out + n), _mm_shuffle_epi8(a, gather));
    _mm_storel_epi64(reinterpret_cast<__m128i*>(out + n + 2), _mm_shuffle_epi8(b, gather));
    n += 4;
  }
  for (; n < fit && p[6 * n] == tag[0] && p[6 * n + 1] == tag[1]; ++n)
    out[n] = wire::loadFloat(p + 6 * n + 2);
  return n;
}

bool hasSSSE3() {
  static const bool has = __builtin_cpu_supports("ssse3");
  return has;
}
#endif

// The rest of a run once its first value is read: `fit` whole entries follow
// at `next`. An empty list fills the reader's shared array in one pass; any
// other list counts the run, grows once and copies.
template <size_t TagSize>
size_t readRunTail(PBDataReader& reader, MutableFields& fields, PBRepeatedFloat& list,
                   const uint8_t* tag, float first, const uint8_t* next, size_t fit) {
  const Run<TagSize> run(tag);
  if (list.capacity() == 0 && fields.lentFloats) {
    size_t available;
    float* room = reader.floatRoom(*fields.lentFloats, &available);
    if (room && available > fit) {
      room[0] = first;
#if defined(__x86_64__)
      size_t n;
      if (!hasSSSE3())
        n = run.countAndCopy(room + 1, next, fit);
      else if constexpr (TagSize == 1)
        n = countAndCopyShuffled(room + 1, next, tag[0], fit);
      else
        n = countAndCopyShuffled2(room + 1, next, tag, fit);
#else
      const size_t n = run.countAndCopy(room + 1, next, fit);
#endif
      reader.claimFloats(n + 1, *fields.lentFloats);
      list.lend(room, n + 1);
      list.appendUninitialized(n + 1);
      return n;
    }
  }
  const size_t n = run.count(next, fit);
  float* out = appendRoom(reader, fields, list, n + 1);
  out[0] = first;
  run.copy(out + 1, next, n);
  return n;
}

size_t readRunTailOtherTag(PBRepeatedFloat& list, const uint8_t* tag, size_t tagSize, float first,
                           const uint8_t* next, size_t fit) {
  const size_t stride = tagSize + 4;
  size_t n = 0;
  while (n < fit && std::memcmp(next + n * stride, tag, tagSize) == 0) ++n;
  float* out = list.appendUninitialized(n + 1);
  out[0] = first;
  for (size_t i = 0; i < n; ++i) out[1 + i] = wire::loadFloat(next + i * stride + tagSize);
  return n;
}

// One unpacked element, whose tag is the `tagSize` bytes at `tag`, then every
// directly following entry with the very same tag bytes: the usual shape of a
// list written unpacked. Only whole entries before the limit count; the list
// grows once, to its exact size when it was empty, and the dispatch loop is
// not re-entered per element.
void readUnpackedRun(PBDataReader& reader, MutableFields& fields, PBRepeatedFloat& list,
                     const uint8_t* tag, size_t tagSize) {
  if (reader.remaining() < 4) {
    list.add(reader.readFloat());  // sets the error flag and appends 0.0
    return;
  }
  const float first = wire::loadFloat(reader.cursor());
  const uint8_t* next = reader.cursor() + 4;
  const size_t fit = (reader.remaining() - 4) / (tagSize + 4);
  size_t n;
  switch (tagSize) {
    case 1:
      n = readRunTail<1>(reader, fields, list, tag, first, next, fit);
      break;
    case 2:
      n = readRunTail<2>(reader, fields, list, tag, first, next, fit);
      break;
    default:
      n = readRunTailOtherTag(list, tag, tagSize, first, next, fit);
  }
  reader.advance(4 + n * (tagSize + 4));
}

}  // namespace

// Tells an observer, if the reader has one, where a message's fields begin and end.
class ObservedMessage {
 public:
  explicit ObservedMessage(WireObserver* observer) : observer_(observer) {
    if (observer_) observer_->beginMessage();
  }
  ~ObservedMessage() {
    if (observer_) observer_->endMessage();
  }
  ObservedMessage(const ObservedMessage&) = delete;
  ObservedMessage& operator=(const ObservedMessage&) = delete;

 private:
  WireObserver* observer_;
};

bool readFields(const MessageTable& table, MutableFields fields, PBDataReader& reader) {
  WireObserver* const observer = reader.observer();
  const ObservedMessage observed(observer);
  while (!reader.hasError() && !reader.isAtEnd()) {
    const size_t tagStart = reader.position();
    const uint64_t tag = reader.readVarint();
    if (reader.hasError()) break;
    if (observer) observer->tag(tagStart, tag, reader.position() - tagStart);
    const auto wireType = static_cast<uint8_t>(tag & 7);
    if (wireType == wire::kEndGroup) {
      if (observer) observer->endGroup(reader.remaining());
      break;
    }
    const auto number = static_cast<uint32_t>(tag >> 3);

    const FieldDescriptor* d = table.find(number);
    if (!d) {
      if (!PBReaderSkipValueWithTag(reader, number, wireType)) return false;
      continue;
    }
    if (observer) observer->field(*d, wireType);
    switch (d->kind) {
      case FieldKind::SubMessage: {
        // A repeated occurrence replaces the earlier one instead of merging
        // into it, and the new instance is in place before its bytes are
        // checked, so a cut-off sub-message still reads as present.
        std::shared_ptr<PBCodable>& message = fields.subs[d->slot];
        message = d->makeMessage();
        PBDataReaderMark mark;
        if (!PBReaderPlaceMark(reader, mark)) return false;
        if (!message->readFrom(reader)) return false;
        // A sub-message that stopped at an end-group tag leaves the position
        // inside its run; reading goes on from there.
        PBReaderRecallMark(reader, mark);
        break;
      }
      case FieldKind::RepeatedFloat: {
        PBRepeatedFloat& list = fields.lists[d->slot];
        if (wireType == wire::kLengthDelimited) {
          PBDataReaderMark mark;
          if (!PBReaderPlaceMark(reader, mark)) return false;
          readPackedRun(reader, fields, list);
          PBReaderRecallMark(reader, mark);
        } else if (observer) {
          // One element a turn, so that the observer is told of every tag.
          list.add(reader.readFloat());
        } else {
          readUnpackedRun(reader, fields, list, reader.bytes() + tagStart,
                          reader.position() - tagStart);
        }
        break;
      }
      case FieldKind::Uint32:
        fields.ints[d->slot] = static_cast<uint32_t>(reader.readVarint());
        break;
      // The has-bit goes first: a value cut off by the limit leaves the field
      // present with 0.
      case FieldKind::OptionalFloat:
        *fields.has |= d->hasMask();
        fields.floats[d->slot] = reader.readFloat();
        break;
      case FieldKind::OptionalEnum:
        *fields.has |= d->hasMask();
        fields.ints[d->slot] = static_cast<uint32_t>(reader.readVarint());
        break;
    }
  }
  return !reader.hasError();
}

}  // namespace kolvrand::detail
