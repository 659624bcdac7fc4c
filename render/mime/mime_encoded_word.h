// RFC 2047 encoded words ("=?charset?B?...?=" and "=?charset?Q?...?=") and the charset names
// used in them.
//
// Text handed to the encoder is UTF-8; it is converted to the target charset first. Words are
// cut only between characters, so each word decodes on its own, and no word is longer than
// 75 characters. The Q form writes only letters, digits and "!*+-/" literally, the set
// RFC 2047 allows in every place a word may stand (a display name, a comment, plain text),
// so a comma or quote in a name can never leak into the structure of an address field.
#ifndef TARNWELL_RENDER_MIME_MIME_ENCODED_WORD_H_
#define TARNWELL_RENDER_MIME_MIME_ENCODED_WORD_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "base/byte_view.h"
#include "render/mime/mime_codes.h"

namespace tarnwell::render {

inline constexpr size_t kMaxEncodedWordLength = 75;
inline constexpr std::string_view kCharsetUtf8 = "utf-8";

// The Windows code page of a MIME charset name (case-insensitive), or 0 when unknown.
uint32_t CodePageForCharset(std::string_view charset);
// The MIME charset name for a Windows code page; windows-1252 for numbers without one.
std::string CharsetForCodePage(uint32_t codepage);

// 'Q' when the quoted form is not much longer than Base64 would be, else 'B'. `bytes` are
// already in the target charset.
char ChooseWordEncoding(ByteView bytes);

// Encodes UTF-8 `text` as words in `charset` ('B' or 'Q', 0 to choose). The first word is at
// most first_limit characters long, the others at most limit (both capped at 75); a word
// always carries at least one character, so a limit below the fixed overhead still makes
// progress. An unknown charset name is replaced by utf-8: a word must never claim a charset
// its bytes are not in.
std::vector<std::string> EncodeWords(std::string_view text, std::string_view charset,
                                     char letter = 0, size_t first_limit = kMaxEncodedWordLength,
                                     size_t limit = kMaxEncodedWordLength);

// Decodes one complete encoded word to UTF-8; false when `word` is not one.
bool DecodeEncodedWord(std::string_view word, std::string* utf8);
// If an encoded word starts at text[pos], its length, else 0.
size_t MatchEncodedWord(std::string_view text, size_t pos);
// Decodes every encoded word in unstructured text; blanks between two adjacent words are
// dropped, as RFC 2047 says. Text outside words is taken as UTF-8 when it is valid, else as
// windows-1252.
std::string DecodeEncodedWords(std::string_view text);
// The charset named by the first encoded word in `text`, or "" when there is none.
std::string FirstEncodedWordCharset(std::string_view text);
// Bytes in a named charset to UTF-8; an unknown charset is read as UTF-8 when the bytes are
// valid UTF-8, else as windows-1252.
std::string CharsetBytesToUtf8(std::string_view bytes, std::string_view charset);
// Raw 8-bit header text to UTF-8 by the same rule.
std::string HeaderBytesToUtf8(std::string_view text);

// The coder form: input is UTF-8 text; the output is its words separated by single spaces.
class CMimeEncodedWord : public CMimeCodeBase {
 public:
  void SetCharset(std::string charset) { charset_ = std::move(charset); }
  const std::string& charset() const { return charset_; }
  // 'B', 'Q', or 0 to choose by the content.
  void SetEncoding(char letter) { letter_ = letter; }

  uint64_t GetEncodeLength() const override;
  bool EncodeTo(MimeSink* sink) const override;
  bool DecodeTo(MimeSink* sink) const override;

 private:
  std::string charset_{kCharsetUtf8};
  char letter_ = 0;
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_ENCODED_WORD_H_
