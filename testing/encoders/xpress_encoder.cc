#include "testing/encoders/xpress_encoder.h"

#include <cstdint>
#include <utility>
#include <vector>

namespace tarnwell::forge {

namespace {

constexpr size_t kFlagWordSize = 4;
constexpr int kFlagsPerWord = 32;
constexpr size_t kMinMatch = 3;
constexpr size_t kMaxDistance = 8192;
constexpr uint64_t kMaxLengthField = 0xffffffff;  // length - 3 in the 32-bit form
constexpr uint64_t kLengthCodeEscape = 7;
constexpr uint64_t kNibbleEscape = 15;
constexpr uint64_t kExtra8Escape = 255;
constexpr uint64_t kExtra16Limit = 0x10000;
constexpr int kDistanceShift = 3;
constexpr int kHighNibbleShift = 4;
constexpr int kHashBits = 15;
constexpr int kMaxChain = 64;                      // candidates tried per position
constexpr uint32_t kHashMultiplier = 2654435761u;  // Knuth's multiplicative hash
constexpr uint32_t kAllMatchFlags = 0xffffffff;

constexpr uint8_t kEseXpressScheme = 0x18;
constexpr size_t kEseMaxDecodedSize = 0xffff;

uint32_t Hash3(const uint8_t* p) {
  const uint32_t v = uint32_t{p[0]} | (uint32_t{p[1]} << 8) | (uint32_t{p[2]} << 16);
  return (v * kHashMultiplier) >> (32 - kHashBits);
}

class StreamWriter {
 public:
  StreamWriter() { out_.resize(kFlagWordSize); }

  void Literal(uint8_t b) {
    out_.push_back(b);
    Flag(false);
  }

  void Match(size_t distance, uint64_t length) {
    const uint64_t code = length - kMinMatch;
    const uint16_t token_base = static_cast<uint16_t>((distance - 1) << kDistanceShift);
    if (code < kLengthCodeEscape) {
      Put16(static_cast<uint16_t>(token_base | code));
    } else {
      Put16(static_cast<uint16_t>(token_base | kLengthCodeEscape));
      const uint64_t rest = code - kLengthCodeEscape;
      const uint8_t nibble = static_cast<uint8_t>(rest < kNibbleEscape ? rest : kNibbleEscape);
      if (half_byte_pos_ == 0) {
        half_byte_pos_ = out_.size();
        out_.push_back(nibble);
      } else {
        out_[half_byte_pos_] |= static_cast<uint8_t>(nibble << kHighNibbleShift);
        half_byte_pos_ = 0;
      }
      if (rest >= kNibbleEscape) {
        const uint64_t rest8 = rest - kNibbleEscape;
        if (rest8 < kExtra8Escape) {
          out_.push_back(static_cast<uint8_t>(rest8));
        } else {
          out_.push_back(static_cast<uint8_t>(kExtra8Escape));
          if (code < kExtra16Limit) {
            Put16(static_cast<uint16_t>(code));
          } else {
            Put16(0);
            Put32(static_cast<uint32_t>(code));
          }
        }
      }
    }
    Flag(true);
  }

  Bytes Finish() {
    // Pad the open flag word with match flags: the first one meets the end
    // of input and ends the stream.
    const int unused = kFlagsPerWord - flag_count_;
    const uint32_t padded = unused == kFlagsPerWord
                                ? kAllMatchFlags
                                : (flags_ << unused) | ((uint32_t{1} << unused) - 1);
    StoreU32LE(out_.data() + flag_pos_, padded);
    return std::move(out_);
  }

 private:
  void Flag(bool match) {
    flags_ = (flags_ << 1) | (match ? 1u : 0u);
    if (++flag_count_ == kFlagsPerWord) {
      StoreU32LE(out_.data() + flag_pos_, flags_);
      flag_pos_ = out_.size();
      out_.resize(out_.size() + kFlagWordSize);
      flags_ = 0;
      flag_count_ = 0;
    }
  }
  void Put16(uint16_t v) {
    out_.push_back(static_cast<uint8_t>(v));
    out_.push_back(static_cast<uint8_t>(v >> 8));
  }
  void Put32(uint32_t v) {
    Put16(static_cast<uint16_t>(v));
    Put16(static_cast<uint16_t>(v >> 16));
  }

  Bytes out_;
  size_t flag_pos_ = 0;
  uint32_t flags_ = 0;
  int flag_count_ = 0;
  size_t half_byte_pos_ = 0;  // 0: no half-used length byte (offset 0 is a flag word)
};

}  // namespace

Bytes XpressCompress(ByteView plain) {
  const uint8_t* data = plain.data();
  const size_t n = plain.size();
  StreamWriter writer;
  // Chains of earlier positions with the same 3-byte hash, newest first;
  // entries are position + 1 so that 0 means "none".
  std::vector<uint32_t> head(size_t{1} << kHashBits, 0);
  std::vector<uint32_t> prev(n, 0);
  auto insert = [&](size_t pos) {
    if (pos + kMinMatch > n) return;
    const uint32_t h = Hash3(data + pos);
    prev[pos] = head[h];
    head[h] = static_cast<uint32_t>(pos + 1);
  };

  size_t i = 0;
  while (i < n) {
    size_t best_len = 0;
    size_t best_distance = 0;
    if (i + kMinMatch <= n) {
      const uint64_t max_len64 = uint64_t{n - i};
      const size_t max_len = static_cast<size_t>(
          max_len64 > kMaxLengthField + kMinMatch ? kMaxLengthField + kMinMatch : max_len64);
      uint32_t candidate = head[Hash3(data + i)];
      for (int step = 0; candidate != 0 && step < kMaxChain; ++step) {
        const size_t j = candidate - 1;
        const size_t distance = i - j;
        if (distance > kMaxDistance) break;
        size_t len = 0;
        while (len < max_len && data[j + len] == data[i + len]) ++len;
        if (len > best_len) {
          best_len = len;
          best_distance = distance;
          if (len == max_len) break;
        }
        candidate = prev[j];
      }
    }
    if (best_len >= kMinMatch) {
      writer.Match(best_distance, best_len);
      for (size_t k = 0; k < best_len; ++k) insert(i + k);
      i += best_len;
    } else {
      writer.Literal(data[i]);
      insert(i);
      ++i;
    }
  }
  return writer.Finish();
}

Bytes EncodeEseXpressValue(ByteView plain) {
  if (plain.size() > kEseMaxDecodedSize) return {};
  const Bytes stream = XpressCompress(plain);
  Bytes value = {kEseXpressScheme, 0, 0};
  StoreU16LE(value.data() + 1, static_cast<uint16_t>(plain.size()));
  value.insert(value.end(), stream.begin(), stream.end());
  return value;
}

}  // namespace tarnwell::forge
