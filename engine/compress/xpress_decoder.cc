#include "engine/compress/xpress_decoder.h"

namespace tarnwell::engine {

namespace {

constexpr size_t kFlagWordSize = 4;
constexpr int kFlagsPerWord = 32;
constexpr size_t kMatchTokenSize = 2;
constexpr size_t kExtra16Size = 2;
constexpr size_t kExtra32Size = 4;
constexpr uint32_t kLengthCodeMask = 0x7;
constexpr int kDistanceShift = 3;
constexpr uint64_t kMinMatch = 3;
constexpr uint64_t kLengthCodeEscape = 7;
constexpr uint64_t kNibbleEscape = 15;
constexpr uint64_t kExtra8Escape = 255;
constexpr uint8_t kNibbleMask = 0x0f;
constexpr int kHighNibbleShift = 4;

// Reads the length of a match whose 3-bit code was `code`; false when the
// input ends inside the length fields or a full-width length is too small to
// need that form. Returns the length in *length.
bool ReadMatchLength(ByteView in, uint32_t code, size_t* pos, size_t* half_byte_pos,
                     uint64_t* length) {
  uint64_t len = code;
  if (len == kLengthCodeEscape) {
    // The 4-bit extensions of two consecutive long matches share one byte:
    // the first opens it and reads the low half, the second reads the high.
    if (*half_byte_pos == 0) {
      uint8_t b;
      if (!in.ReadU8(*pos, &b)) return false;
      len = b & kNibbleMask;
      *half_byte_pos = *pos;
      *pos += 1;
    } else {
      len = in[*half_byte_pos] >> kHighNibbleShift;
      *half_byte_pos = 0;
    }
    if (len == kNibbleEscape) {
      uint8_t b;
      if (!in.ReadU8(*pos, &b)) return false;
      *pos += 1;
      len = b;
      if (len == kExtra8Escape) {
        uint16_t v16;
        if (!in.ReadU16LE(*pos, &v16)) return false;
        *pos += kExtra16Size;
        len = v16;
        if (len == 0) {
          uint32_t v32;
          if (!in.ReadU32LE(*pos, &v32)) return false;
          *pos += kExtra32Size;
          len = v32;
        }
        // The wide forms hold length - 3 whole; anything shorter than the
        // narrow forms reach is not a stream an encoder writes.
        if (len < kNibbleEscape + kLengthCodeEscape) return false;
        len -= kNibbleEscape + kLengthCodeEscape;
      }
      len += kNibbleEscape;
    }
    len += kLengthCodeEscape;
  }
  *length = len + kMinMatch;
  return true;
}

}  // namespace

XpressResult DecodePlainLz77(ByteView in, uint8_t* out, size_t out_cap, XpressEnd end) {
  if (out == nullptr) out_cap = 0;
  XpressResult result;
  size_t in_pos = 0;
  size_t out_pos = 0;
  uint32_t flags = 0;
  int flags_left = 0;
  // Position of the byte whose high half is still unread; 0 means none (a
  // shared byte never sits at offset 0, which always holds a flag word).
  size_t half_byte_pos = 0;

  auto fail = [&](XpressCode code) {
    result.code = code;
    result.written = out_pos;
    return result;
  };

  for (;;) {
    if (end == XpressEnd::kOutputFull && out_pos == out_cap) break;
    if (flags_left == 0) {
      if (!in.ReadU32LE(in_pos, &flags)) return fail(XpressCode::kMalformed);
      in_pos += kFlagWordSize;
      flags_left = kFlagsPerWord;
    }
    --flags_left;
    if ((flags & (uint32_t{1} << flags_left)) == 0) {
      uint8_t literal;
      if (!in.ReadU8(in_pos, &literal)) return fail(XpressCode::kMalformed);
      if (out_pos == out_cap) return fail(XpressCode::kOutputTooSmall);
      out[out_pos++] = literal;
      in_pos += 1;
      continue;
    }
    if (in_pos == in.size()) break;  // the end marker
    uint16_t token;
    if (!in.ReadU16LE(in_pos, &token)) return fail(XpressCode::kMalformed);
    in_pos += kMatchTokenSize;
    const size_t distance = (size_t{token} >> kDistanceShift) + 1;
    uint64_t length;
    if (!ReadMatchLength(in, token & kLengthCodeMask, &in_pos, &half_byte_pos, &length)) {
      return fail(XpressCode::kMalformed);
    }
    if (distance > out_pos) return fail(XpressCode::kMalformed);
    const size_t room = out_cap - out_pos;
    const size_t copy = length > room ? room : static_cast<size_t>(length);
    // Byte by byte: a match may overlap the bytes it is producing.
    const uint8_t* src = out + out_pos - distance;
    uint8_t* dst = out + out_pos;
    for (size_t i = 0; i < copy; ++i) dst[i] = src[i];
    out_pos += copy;
    if (copy < length) return fail(XpressCode::kOutputTooSmall);
  }
  result.code = XpressCode::kOk;
  result.written = out_pos;
  return result;
}

}  // namespace tarnwell::engine
