#include "testing/exchange/rtf_literal_encoder.h"

#include <algorithm>
#include <array>

namespace tarnwell::forge::exchange {
namespace {

constexpr char kPrologue[] =
    "{\\rtf1\\ansi\\mac\\deff0\\deftab720{\\fonttbl;}{\\f0\\fnil \\froman \\fswiss \\fmodern "
    "\\fscript \\fdecor MS Sans SerifSymbolArialTimes New RomanCourier{\\colortbl\\red0\\green0"
    "\\blue0\r\n\\par \\pard\\plain\\f0\\fs20\\b\\i\\u\\tab\\tx";
constexpr size_t kPrologueSize = sizeof(kPrologue) - 1;
constexpr uint32_t kCrcPolynomial = 0xEDB88320;
constexpr int kTokensPerRun = 8;
constexpr int kOffsetShift = 4;
constexpr size_t kRingMask = kRtfRingSize - 1;

// Tokens and the ring dictionary, kept exactly as a decoder would, so that
// every reference we emit points at bytes the decoder holds.
class StreamWriter {
 public:
  StreamWriter() {
    ring_.fill(0);
    for (size_t i = 0; i < kPrologueSize; ++i) ring_[i] = uint8_t(kPrologue[i]);
    position_ = kPrologueSize;
    filled_ = kPrologueSize;
  }

  void Literal(uint8_t byte) {
    NextToken();
    out_.push_back(byte);
    Put(byte);
  }

  void Reference(size_t offset, size_t length) {
    NextToken();
    out_[control_] |= uint8_t(1u << bit_);
    const uint16_t word = uint16_t((offset << kOffsetShift) | (length - kRtfMinReference));
    out_.push_back(uint8_t(word >> 8));
    out_.push_back(uint8_t(word));
    for (size_t k = 0; k < length; ++k) Put(ring_[(offset + k) & kRingMask]);
  }

  // A reference to the write position: the decoder's end marker.
  void End() {
    NextToken();
    out_[control_] |= uint8_t(1u << bit_);
    const uint16_t word = uint16_t(position_ << kOffsetShift);
    out_.push_back(uint8_t(word >> 8));
    out_.push_back(uint8_t(word));
  }

  // The longest match (up to kRtfMaxReference) for text[pos..] among
  // offsets the decoder holds; 0 when none reaches kRtfMinReference.
  size_t LongestMatch(std::string_view text, size_t pos, size_t* best_offset) const {
    size_t best = 0;
    const size_t limit = std::min(kRtfMaxReference, text.size() - pos);
    if (limit < kRtfMinReference) return 0;
    for (size_t offset = 0; offset < kRtfRingSize; ++offset) {
      if (offset == position_) continue;  // would read as the end marker
      size_t k = 0;
      for (; k < limit; ++k) {
        const size_t at = (offset + k) & kRingMask;
        const size_t ahead = (at + kRtfRingSize - position_) & kRingMask;
        uint8_t byte;
        if (ahead < k) {
          byte = uint8_t(text[pos + ahead]);  // written earlier by this same copy
        } else if (at < filled_) {
          byte = ring_[at];
        } else {
          break;  // never written: leave it alone
        }
        if (byte != uint8_t(text[pos + k])) break;
      }
      if (k > best) {
        best = k;
        *best_offset = offset;
        if (best == limit) break;
      }
    }
    return best >= kRtfMinReference ? best : 0;
  }

  Bytes Finish(size_t raw_size) {
    End();
    Bytes value(kRtfValueHeaderSize + out_.size());
    std::copy(out_.begin(), out_.end(), value.begin() + kRtfValueHeaderSize);
    StoreU32LE(value.data(), uint32_t(out_.size() + kRtfValueHeaderSize - 4));
    StoreU32LE(value.data() + 4, uint32_t(raw_size));
    StoreU32LE(value.data() + 8, kRtfTypeCompressed);
    StoreU32LE(value.data() + 12, RtfCrc(ByteView(out_)));
    return value;
  }

 private:
  void NextToken() {
    if (bit_ == kTokensPerRun - 1 || out_.empty()) {
      control_ = out_.size();
      out_.push_back(0);
      bit_ = 0;
    } else {
      ++bit_;
    }
  }
  void Put(uint8_t byte) {
    ring_[position_] = byte;
    position_ = (position_ + 1) & kRingMask;
    if (filled_ < kRtfRingSize) ++filled_;
  }

  std::array<uint8_t, kRtfRingSize> ring_;
  size_t position_ = 0;
  size_t filled_ = 0;
  Bytes out_;
  size_t control_ = 0;
  int bit_ = kTokensPerRun - 1;
};

}  // namespace

std::string_view RtfPrologue() { return std::string_view(kPrologue, kPrologueSize); }

uint32_t RtfCrc(ByteView stream) {
  static const std::array<uint32_t, 256> table = [] {
    std::array<uint32_t, 256> t{};
    for (uint32_t n = 0; n < 256; ++n) {
      uint32_t c = n;
      for (int k = 0; k < 8; ++k) c = (c & 1) ? kCrcPolynomial ^ (c >> 1) : c >> 1;
      t[n] = c;
    }
    return t;
  }();
  uint32_t crc = 0;
  for (size_t i = 0; i < stream.size(); ++i) crc = table[(crc ^ stream[i]) & 0xFF] ^ (crc >> 8);
  return crc;
}

Bytes EncodeRtfLiteral(std::string_view rtf) {
  StreamWriter w;
  for (char c : rtf) w.Literal(uint8_t(c));
  return w.Finish(rtf.size());
}

Bytes EncodeRtfCompressed(std::string_view rtf) {
  StreamWriter w;
  for (size_t pos = 0; pos < rtf.size();) {
    size_t offset = 0;
    const size_t length = w.LongestMatch(rtf, pos, &offset);
    if (length) {
      w.Reference(offset, length);
      pos += length;
    } else {
      w.Literal(uint8_t(rtf[pos++]));
    }
  }
  return w.Finish(rtf.size());
}

}  // namespace tarnwell::forge::exchange
