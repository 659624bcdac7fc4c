#include "base/paths.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "base/text.h"

namespace tarnwell {
namespace {

constexpr std::string_view kWindowsForbidden = "\\/:*?\"<>|";
constexpr char32_t kLastC0Control = 0x1F;
constexpr char32_t kFirstC1Control = 0x7F;  // DEL, then the C1 block
constexpr char32_t kLastC1Control = 0x9F;
constexpr char32_t kAscii = 0x80;
// An extension longer than this is cut, so that a hostile one cannot crowd out the stem.
constexpr size_t kMaxExtensionBytes = 64;
constexpr size_t kMaxTempPrefixBytes = 64;
constexpr std::string_view kDeviceNames[] = {"con", "prn", "aux", "nul"};
constexpr std::string_view kNumberedDevicePrefixes[] = {"com", "lpt"};

bool IsBidiControl(char32_t cp) {
  return (cp >= 0x202A && cp <= 0x202E) || (cp >= 0x2066 && cp <= 0x2069);
}

// Steps 1 and 2 of SafeFileName.
std::string ReplaceUnsafeCharacters(std::string_view name) {
  std::string out;
  out.reserve(name.size());
  size_t pos = 0;
  while (pos < name.size()) {
    const char32_t cp = DecodeUtf8(name, &pos);
    if (cp <= kLastC0Control || (cp >= kFirstC1Control && cp <= kLastC1Control) ||
        (cp < kAscii && kWindowsForbidden.find(char(cp)) != std::string_view::npos)) {
      out.push_back(' ');
    } else if (!IsBidiControl(cp)) {
      AppendUtf8(cp, &out);
    }
  }
  return out;
}

bool IsSpaceOrDot(char c) { return c == ' ' || c == '.'; }

std::string_view TrimTrailing(std::string_view s) {
  while (!s.empty() && IsSpaceOrDot(s.back())) s.remove_suffix(1);
  return s;
}

std::string_view TrimBothEnds(std::string_view s) {
  while (!s.empty() && IsSpaceOrDot(s.front())) s.remove_prefix(1);
  return TrimTrailing(s);
}

bool IsWindowsDeviceName(std::string_view name) {
  std::string_view base = name.substr(0, name.find('.'));
  while (!base.empty() && base.back() == ' ') base.remove_suffix(1);
  const std::string lower = AsciiLower(base);
  for (std::string_view device : kDeviceNames) {
    if (lower == device) return true;
  }
  for (std::string_view prefix : kNumberedDevicePrefixes) {
    if (lower.size() == prefix.size() + 1 && lower.starts_with(prefix) && lower.back() >= '1' &&
        lower.back() <= '9') {
      return true;
    }
  }
  return false;
}

struct SplitPath {
  bool absolute = false;
  std::vector<std::string_view> parts;
};

SplitPath SplitNormalized(std::string_view path) {
  SplitPath split;
  split.absolute = !path.empty() && path.front() == '/';
  size_t pos = 0;
  while (pos <= path.size()) {
    size_t slash = path.find('/', pos);
    if (slash == std::string_view::npos) slash = path.size();
    const std::string_view part = path.substr(pos, slash - pos);
    pos = slash + 1;
    if (part.empty() || part == ".") continue;
    if (part == "..") {
      if (!split.parts.empty() && split.parts.back() != "..") {
        split.parts.pop_back();
      } else if (!split.absolute) {
        split.parts.push_back(part);
      }
      continue;
    }
    split.parts.push_back(part);
  }
  return split;
}

bool Exists(const std::string& path) {
  struct stat st;
  return ::lstat(path.c_str(), &st) == 0;
}

}  // namespace

std::string SafeFileName(std::string_view name, size_t max_bytes) {
  max_bytes = std::max(max_bytes, kFallbackFileName.size());
  const std::string cleaned = ReplaceUnsafeCharacters(name);
  std::string out(TrimTrailing(TruncateUtf8(TrimBothEnds(cleaned), max_bytes)));
  if (IsWindowsDeviceName(out)) out = std::string(TrimTrailing(TruncateUtf8("_" + out, max_bytes)));
  if (out.empty()) out = kFallbackFileName;
  return out;
}

std::string JoinPath(std::string_view a, std::string_view b) {
  while (!b.empty() && b.front() == '/') b.remove_prefix(1);
  if (b.empty()) return std::string(a);
  while (a.size() > 1 && a.back() == '/') a.remove_suffix(1);
  std::string out(a);
  if (!out.empty() && out.back() != '/') out.push_back('/');
  out += b;
  return out;
}

std::string NormalizePath(std::string_view path) {
  const SplitPath split = SplitNormalized(path);
  std::string out = split.absolute ? "/" : "";
  for (size_t i = 0; i < split.parts.size(); ++i) {
    if (i > 0) out.push_back('/');
    out += split.parts[i];
  }
  if (out.empty()) out = ".";
  return out;
}

bool IsInside(std::string_view root, std::string_view candidate) {
  // The kernel would stop reading at a NUL, seeing a different path from the one checked.
  if (root.find('\0') != std::string_view::npos || candidate.find('\0') != std::string_view::npos) {
    return false;
  }
  std::string joined;
  if (candidate.empty() || candidate.front() != '/') {
    joined = JoinPath(root, candidate);
    candidate = joined;
  }
  const SplitPath r = SplitNormalized(root);
  const SplitPath c = SplitNormalized(candidate);
  if (r.absolute != c.absolute || c.parts.size() < r.parts.size()) return false;
  if (!std::equal(r.parts.begin(), r.parts.end(), c.parts.begin())) return false;
  // A root made only of ".." ("../..") is a prefix of a path that climbs further.
  return c.parts.size() == r.parts.size() || c.parts[r.parts.size()] != "..";
}

std::string UniquePath(std::string_view dir, std::string_view stem, std::string_view ext) {
  std::string extension(TrimTrailing(ReplaceUnsafeCharacters(ext)));
  if (!extension.empty() && extension.front() != '.') extension.insert(0, ".");
  extension = std::string(TrimTrailing(TruncateUtf8(extension, kMaxExtensionBytes)));
  for (unsigned n = 0; n < kMaxUniqueAttempts; ++n) {
    const std::string suffix = n == 0 ? "" : " (" + std::to_string(n) + ")";
    const size_t stem_bytes = kMaxFileNameBytes - extension.size() - suffix.size();
    std::string path = JoinPath(dir, SafeFileName(stem, stem_bytes) + suffix + extension);
    if (!Exists(path)) return path;
  }
  return "";
}

Status MakeTempDir(std::string_view prefix, std::string* path) {
  const char* tmpdir = std::getenv("TMPDIR");
  const std::string base = tmpdir != nullptr && tmpdir[0] != '\0' ? tmpdir : "/tmp";
  std::string name_template = JoinPath(base, SafeFileName(prefix, kMaxTempPrefixBytes) + "XXXXXX");
  if (::mkdtemp(name_template.data()) == nullptr) {
    return Status::IoError(name_template + ": " + std::strerror(errno));
  }
  *path = std::move(name_template);
  return Status::Ok();
}

}  // namespace tarnwell
