// Paths and file names for everything the program writes.
//
// Folder names, subjects and attachment names come from the database, which is untrusted
// input; nothing it contains may place a file outside the folder the user chose. Exported
// files are also often copied to Windows, so names avoid what Windows refuses. The rules of
// SafeFileName, applied in this order:
//
//   1. Ill-formed UTF-8 becomes U+FFFD.
//   2. Control characters (U+0000-U+001F, U+007F-U+009F) and the characters Windows forbids
//      in names ( \ / : * ? " < > | ) become spaces. Bidirectional embedding, override and
//      isolate controls (U+202A-U+202E, U+2066-U+2069) are dropped: they only serve to make
//      a name read differently from what it is ("txt.exe" shown as "exe.txt").
//   3. Leading spaces and dots are removed (no hidden files, no "." or ".."), and so are
//      trailing spaces and dots, which Windows drops silently.
//   4. The name is cut to max_bytes without splitting a UTF-8 sequence, and step 3's
//      trailing rule is applied again. max_bytes below the length of "unnamed" counts as
//      that length.
//   5. A name whose part before the first dot is a Windows device name (CON, PRN, AUX, NUL,
//      COM1-COM9, LPT1-LPT9, in any case, trailing spaces ignored) gets a leading '_' and
//      goes through step 4 again. This comes after the cut because a cut can expose one.
//   6. An empty result becomes "unnamed".
//
// The result is one path component, never empty, never "." or "..", without '/' or NUL,
// and SafeFileName(SafeFileName(x)) == SafeFileName(x).
//
// Path checks here are lexical: symbolic links are not followed. The export creates every
// folder below the destination itself, so there are none it did not make.
#ifndef TARNWELL_BASE_PATHS_H_
#define TARNWELL_BASE_PATHS_H_

#include <cstddef>
#include <string>
#include <string_view>

#include "base/status.h"

namespace tarnwell {

// The longest name most Linux file systems accept, in bytes.
inline constexpr size_t kMaxFileNameBytes = 255;
inline constexpr std::string_view kFallbackFileName = "unnamed";

std::string SafeFileName(std::string_view name, size_t max_bytes = kMaxFileNameBytes);

// a + "/" + b with exactly one separator between them. b is always taken as relative to a:
// a leading '/' in b does not make it absolute.
std::string JoinPath(std::string_view a, std::string_view b);

// Removes empty and "." components and resolves ".." against the component before it,
// without looking at the file system. ".." at the root of an absolute path stays at the
// root; leading ".." of a relative path are kept. An empty relative result is ".".
std::string NormalizePath(std::string_view path);

// True when candidate, after normalisation, is root itself or lies below it. A relative
// candidate is taken relative to root. A relative root with an absolute candidate is never
// inside (it cannot be decided without the working directory).
bool IsInside(std::string_view root, std::string_view candidate);

// dir/stem+ext, or dir/stem (n)+ext for the smallest n >= 1 that names nothing yet (a
// dangling symbolic link counts as taken). stem goes through SafeFileName, ext (".eml";
// a missing leading dot is added) through the same character rules, and the stem is
// shortened so that the whole name stays within kMaxFileNameBytes. Returns "" after
// kMaxUniqueAttempts names all taken. Checking and creating are separate steps, so callers
// that may race with another writer create the file with O_EXCL.
inline constexpr unsigned kMaxUniqueAttempts = 100'000;
std::string UniquePath(std::string_view dir, std::string_view stem, std::string_view ext);

// Creates a new folder, readable only by this user, under $TMPDIR (or /tmp when unset or
// empty) named prefix followed by random characters.
Status MakeTempDir(std::string_view prefix, std::string* path);

}  // namespace tarnwell

#endif  // TARNWELL_BASE_PATHS_H_
