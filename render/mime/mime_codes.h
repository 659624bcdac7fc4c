// Content transfer coders: copy, quoted-printable (RFC 2045 section 6.7) and Base64 (RFC 2045
// section 6.8).
//
// A coder is a short-lived object: give it the input, then encode or decode it into a sink.
// The input stays where the caller keeps it; output leaves through a staging buffer of fixed
// size, so encoding a large attachment costs the attachment plus one encoded copy at most (and
// nothing more when the sink is a file). Every coder also has a buffer form that writes into
// caller memory and reports how many bytes it wrote.
//
// Line ends produced are always CR LF.
#ifndef TARNWELL_RENDER_MIME_MIME_CODES_H_
#define TARNWELL_RENDER_MIME_MIME_CODES_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "base/byte_view.h"
#include "render/mime/mime_sink.h"

namespace tarnwell::render {

// The copy coder. In text mode (the default, for 7bit and 8bit parts) every line break -- CR
// LF, a lone CR or a lone LF -- is written as CR LF, because a text part on the wire has no
// other line end. In raw mode ("binary") bytes pass unchanged.
class CMimeCodeBase {
 public:
  static constexpr uint32_t kModeText = 0;
  static constexpr uint32_t kModeRaw = 1;

  CMimeCodeBase() = default;
  CMimeCodeBase(const CMimeCodeBase&) = delete;
  CMimeCodeBase& operator=(const CMimeCodeBase&) = delete;
  virtual ~CMimeCodeBase() = default;

  void SetInput(ByteView input) { input_ = input; }
  void SetInput(std::string_view input) {
    input_ = ByteView(reinterpret_cast<const uint8_t*>(input.data()), input.size());
  }
  ByteView input() const { return input_; }
  // The meaning of the mode flag depends on the class; see kMode* constants.
  void SetMode(uint32_t mode) { mode_ = mode; }
  uint32_t mode() const { return mode_; }

  // Upper bounds of the output size.
  virtual uint64_t GetEncodeLength() const;
  virtual uint64_t GetDecodeLength() const;

  // Streaming forms; false when the sink failed.
  virtual bool EncodeTo(MimeSink* sink) const;
  virtual bool DecodeTo(MimeSink* sink) const;

  // Buffer forms: the number of bytes written, which falls short of the full output when
  // out_size is too small (GetEncodeLength/GetDecodeLength bytes are always enough).
  size_t Encode(char* out, size_t out_size) const;
  size_t Decode(char* out, size_t out_size) const;

  std::string EncodeToString() const;
  Bytes DecodeToBytes() const;

 private:
  ByteView input_;
  uint32_t mode_ = kModeText;
};

// Quoted-printable. Text mode treats CR and LF as line breaks; raw mode escapes them.
// Encoded lines never exceed 76 characters including a soft break's '='.
class CMimeCodeQP : public CMimeCodeBase {
 public:
  uint64_t GetEncodeLength() const override;
  bool EncodeTo(MimeSink* sink) const override;
  bool DecodeTo(MimeSink* sink) const override;
};

// Base64 with the standard alphabet and '=' padding. With line breaks on (the default), a CR
// LF follows every 76 characters and ends the last line.
class CMimeCodeBase64 : public CMimeCodeBase {
 public:
  static constexpr uint32_t kModeNoLineBreaks = 0;
  static constexpr uint32_t kModeLineBreaks = 1;

  CMimeCodeBase64() { SetMode(kModeLineBreaks); }
  uint64_t GetEncodeLength() const override;
  uint64_t GetDecodeLength() const override;
  bool EncodeTo(MimeSink* sink) const override;
  bool DecodeTo(MimeSink* sink) const override;
};

inline constexpr size_t kMaxEncodedLineLength = 76;

// Small helpers shared with the header coders.
std::string Base64Encode(ByteView bytes);  // one line, no breaks
Bytes Base64Decode(std::string_view text);
inline constexpr char kHexDigits[] = "0123456789ABCDEF";
// Value of a hex digit (either case), or -1.
int HexValue(char c);

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_CODES_H_
