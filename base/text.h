// Text conversion at the program's edges.
//
// Inside the program all text is UTF-8 in std::string. Text arrives as UTF-16LE (database
// columns, some file formats) or in a Windows "ANSI" code page, and leaves the same ways.
// Every conversion here is total: it never throws, never stops early and never crashes on bad
// input. The rules:
//
//   UTF-16 -> UTF-8   Surrogate pairs are combined. A lone surrogate becomes U+FFFD. An odd
//                     trailing byte is ignored. With NulHandling::kStopAtFirst the text ends
//                     at the first U+0000 (fixed-size fields padded with NULs).
//   UTF-8 -> UTF-16   Each ill-formed UTF-8 sequence (overlong forms, encoded surrogates,
//                     values past U+10FFFF, truncated sequences, stray continuation bytes)
//                     becomes one U+FFFD per maximal bad subpart, as Unicode recommends, so
//                     one bad byte costs one replacement character and never the rest.
//   code page -> UTF-8  Through glibc iconv. Bytes the code page does not define become
//                     U+FFFD and conversion goes on with the next byte.
//   UTF-8 -> code page  Through glibc iconv. Characters the code page cannot represent
//                     become '?'.
//
// Code pages are Windows code page numbers, mapped to iconv names by IconvNameForCodePage:
// 874, 932, 936, 949, 950, 1250-1258, 20127 (ASCII), 20866/21866 (KOI8), 28591-28599,
// 28603, 28605 (ISO-8859-x), 50220 (ISO-2022-JP), 51932 (EUC-JP), 51949 (EUC-KR),
// 54936 (GB18030), 65000 (UTF-7), 65001 (UTF-8) and 1200 (UTF-16LE). Zero, any other number,
// or a name this system's iconv lacks, means windows-1252. UTF-8 and UTF-16LE are converted
// without iconv, by the routines above, so that they follow the same replacement rules.
//
// iconv handles are cached per thread and closed when the thread ends, so conversions may
// run on any number of threads at once.
#ifndef TARNWELL_BASE_TEXT_H_
#define TARNWELL_BASE_TEXT_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "base/byte_view.h"

namespace tarnwell {

inline constexpr char32_t kReplacementChar = 0xFFFD;
inline constexpr uint32_t kDefaultCodePage = 1252;
inline constexpr uint32_t kCodePageUtf16LE = 1200;
inline constexpr uint32_t kCodePageUtf8 = 65001;

enum class NulHandling { kKeep, kStopAtFirst };

// ---- UTF-16 <-> UTF-8

std::string Utf16LEToUtf8(ByteView bytes, NulHandling nul = NulHandling::kKeep);
std::string Utf16ToUtf8(std::u16string_view text, NulHandling nul = NulHandling::kKeep);
std::u16string Utf8ToUtf16(std::string_view text);
// UTF-16LE bytes without a terminator.
Bytes Utf8ToUtf16LE(std::string_view text);
// Number of UTF-16 code units Utf8ToUtf16(text) would produce; for limits counted in
// Windows characters.
size_t Utf16Length(std::string_view text);

// ---- UTF-8 building blocks

// Decodes the code point at text[*pos] (pos < text.size()) and advances *pos past it. An
// ill-formed sequence yields kReplacementChar and *pos moves past its maximal bad subpart
// (always at least one byte).
char32_t DecodeUtf8(std::string_view text, size_t* pos);
// Appends the UTF-8 form of cp; surrogates and values past U+10FFFF append U+FFFD.
void AppendUtf8(char32_t cp, std::string* out);
bool IsValidUtf8(std::string_view text);
// text with every ill-formed sequence replaced as described above.
std::string ToValidUtf8(std::string_view text);
// The longest prefix of at most max_bytes bytes that does not end inside a multi-byte
// sequence. For valid UTF-8 the prefix is valid UTF-8.
std::string_view TruncateUtf8(std::string_view text, size_t max_bytes);

// ---- Code pages

// The iconv name used for a Windows code page, after the windows-1252 fallback for unknown
// numbers. Does not check that iconv can open it.
const char* IconvNameForCodePage(uint32_t codepage);
std::string CodePageToUtf8(ByteView bytes, uint32_t codepage = kDefaultCodePage);
std::string Utf8ToCodePage(std::string_view text, uint32_t codepage = kDefaultCodePage);

// ---- Small helpers

// Lower-cases A-Z only; every other byte, including UTF-8 sequences, is kept.
std::string AsciiLower(std::string_view text);
bool EqualsIgnoreAsciiCase(std::string_view a, std::string_view b);
// The text before the first NUL byte (all of it when there is none). For single- and
// multi-byte code pages and UTF-8; UTF-16 has NulHandling instead.
std::string_view TrimNul(std::string_view text);
ByteView TrimNul(ByteView bytes);

}  // namespace tarnwell

#endif  // TARNWELL_BASE_TEXT_H_
