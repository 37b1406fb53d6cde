// Random models in their dictionary form, reproducible from a seed. Their
// shape (which keys, and of which kind) is taken from a full example model's
// dictionary, so every field of the schema is exercised without the tests
// listing the fields again.
#pragma once

#include <bit>
#include <cfloat>
#include <cstdint>
#include <limits>
#include <random>
#include <string>

#include "model/OTAParamRC.h"
#include "platform/Value.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand::test {

class RandomModels {
 public:
  explicit RandomModels(uint64_t seed)
      : rng_(seed), shape_(makeExampleModel(0x2168)->dictionaryRepresentation()) {}

  // A dictionary that a model would give: every list (some empty), some
  // sub-messages, optional values and the enum left out.
  Value next() { return like(shape_); }

  // A float of any kind; NaN only as the one quiet NaN, since JSON's "NaN"
  // carries neither sign nor payload.
  float randomFloat() {
    static const float kSpecial[] = {0.0f,
                                     -0.0f,
                                     std::numeric_limits<float>::infinity(),
                                     -std::numeric_limits<float>::infinity(),
                                     std::numeric_limits<float>::quiet_NaN(),
                                     std::numeric_limits<float>::denorm_min(),
                                     -std::numeric_limits<float>::denorm_min(),
                                     FLT_MIN,
                                     FLT_MAX,
                                     -FLT_MAX,
                                     0.1f,
                                     1.0f / 3.0f,
                                     16777216.0f};
    switch (pick(10)) {
      case 0:
        return kSpecial[pick(std::size(kSpecial))];
      case 1:
      case 2:
      case 3:
      case 4: {
        float f = std::bit_cast<float>(static_cast<uint32_t>(rng_()));
        return f != f ? std::numeric_limits<float>::quiet_NaN() : f;
      }
      default:
        return std::uniform_real_distribution<float>(-5.0f, 5.0f)(rng_);
    }
  }

  size_t pick(size_t n) { return static_cast<size_t>(rng_() % n); }

 private:
  Value like(const Value& shape) {
    if (const Dictionary* d = shape.asDictionary()) {
      Dictionary out;
      for (const auto& [key, value] : *d) {
        if (value.isArray()) {
          Array list(pick(5) == 0 ? 0 : pick(24));
          for (Value& v : list) v = Number::fromFloat(randomFloat());
          out.set(key, std::move(list));
        } else if (value.isDictionary()) {
          if (pick(10) < 7) out.set(key, like(value));
        } else if (value.asNumber() && value.asNumber()->kind() == Number::Kind::Unsigned) {
          out.set(key, Number::fromUnsigned(static_cast<uint32_t>(rng_())));
        } else if (value.isNumber()) {
          if (pick(10) < 6) out.set(key, Number::fromFloat(randomFloat()));
        } else if (value.isString()) {
          if (pick(10) < 6) out.set(key, randomEnumName());
        }
      }
      return out;
    }
    return shape;
  }

  std::string randomEnumName() {
    switch (pick(3)) {
      case 0:
        return OTAParamRC::mLBConfigAsString(kKVRRegularMLB);
      case 1:
        return OTAParamRC::mLBConfigAsString(kKVRNorthSouthSplitMLB);
      default: {
        int32_t v = static_cast<int32_t>(rng_());
        if (v == 0 || v == 1) v = INT32_MIN;
        return OTAParamRC::mLBConfigAsString(v);
      }
    }
  }

  std::mt19937_64 rng_;
  Value shape_;
};

}  // namespace kolvrand::test
