#include "render/mime/mime_parser.h"

#include <cstring>

namespace tarnwell::render {
namespace {

bool IsBlank(uint8_t c) { return c == ' ' || c == '\t'; }

// The line starting at `pos`: [pos, content_end) without its line end, next = start of the
// following line.
void NextLine(ByteView data, size_t pos, size_t* content_end, size_t* next) {
  const uint8_t* start = data.data() + pos;
  const void* lf = std::memchr(start, '\n', data.size() - pos);
  size_t end =
      lf ? static_cast<size_t>(static_cast<const uint8_t*>(lf) - data.data()) : data.size();
  *next = lf ? end + 1 : end;
  if (lf && end > pos && data[end - 1] == '\r') --end;
  *content_end = end;
}

// Whether a delimiter line for `boundary` starts at `pos`; sets *closing for "--boundary--"
// and *line_end to the start of the next line.
bool IsDelimiterAt(ByteView data, size_t pos, std::string_view boundary, bool* closing,
                   size_t* line_end) {
  const size_t length = 2 + boundary.size();
  if (!data.Has(pos, length)) return false;
  const uint8_t* p = data.data() + pos;
  if (p[0] != '-' || p[1] != '-' || std::memcmp(p + 2, boundary.data(), boundary.size()) != 0) {
    return false;
  }
  size_t content_end, next;
  NextLine(data, pos, &content_end, &next);
  size_t i = pos + length;
  *closing = i + 2 <= content_end && data[i] == '-' && data[i + 1] == '-';
  if (*closing) {
    i += 2;
  } else {
    // Only blanks may follow the boundary on its line; "--boundaryX" is another boundary.
    while (i < content_end && IsBlank(data[i])) ++i;
    if (i != content_end) return false;
  }
  *line_end = next;
  return true;
}

}  // namespace

size_t ParseHeaderBlock(ByteView data, std::vector<RawField>* fields) {
  size_t pos = 0;
  size_t header_bytes = 0;
  bool last_is_field = false;
  while (pos < data.size()) {
    size_t content_end, next;
    NextLine(data, pos, &content_end, &next);
    if (content_end == pos) {  // the empty line
      pos = next;
      break;
    }
    const auto* line = reinterpret_cast<const char*>(data.data() + pos);
    const size_t length = content_end - pos;
    header_bytes += next - pos;
    pos = next;
    if (header_bytes > kMaxHeaderBytes) continue;
    if (IsBlank(static_cast<uint8_t>(line[0]))) {
      // A continuation: the line end goes, the blank that starts it stays.
      if (last_is_field) fields->back().value.append(line, length);
      continue;
    }
    const char* colon = static_cast<const char*>(std::memchr(line, ':', length));
    last_is_field = false;
    if (!colon || colon == line || fields->size() >= kMaxHeaderFields) continue;
    size_t name_length = colon - line;
    while (name_length > 0 && IsBlank(static_cast<uint8_t>(line[name_length - 1]))) --name_length;
    if (name_length == 0) continue;
    RawField field;
    field.name.assign(line, name_length);
    if (field.name.find_first_of(" \t") != std::string::npos) continue;  // e.g. an mbox "From "
    size_t value_start = colon + 1 - line;
    while (value_start < length && IsBlank(static_cast<uint8_t>(line[value_start]))) {
      ++value_start;
    }
    field.value.assign(line + value_start, length - value_start);
    fields->push_back(std::move(field));
    last_is_field = true;
  }
  // A value that starts on a continuation line keeps no blank in front.
  for (RawField& field : *fields) {
    const size_t start = field.value.find_first_not_of(" \t");
    field.value.erase(0, start == std::string::npos ? field.value.size() : start);
  }
  return pos;
}

MultipartPieces SplitMultipart(ByteView body, std::string_view boundary, size_t max_parts) {
  MultipartPieces pieces;
  if (boundary.empty() || boundary.size() > kMaxBoundaryLength) {
    pieces.preamble = body;
    return pieces;
  }
  // Every delimiter line starts the body or follows a line feed.
  size_t part_start = 0;
  bool in_preamble = true;
  size_t pos = 0;
  while (pos <= body.size()) {
    bool closing = false;
    size_t line_end = 0;
    if (IsDelimiterAt(body, pos, boundary, &closing, &line_end)) {
      // The line end before the delimiter belongs to it.
      size_t part_end = pos;
      if (part_end > part_start && body[part_end - 1] == '\n') {
        --part_end;
        if (part_end > part_start && body[part_end - 1] == '\r') --part_end;
      }
      ByteView piece = body.Sub(part_start, part_end - part_start);
      if (in_preamble) {
        pieces.preamble = piece;
        in_preamble = false;
      } else if (pieces.parts.size() < max_parts) {
        pieces.parts.push_back(piece);
      }
      if (closing) {
        pieces.closed = true;
        return pieces;
      }
      part_start = line_end;
      pos = line_end;
      continue;
    }
    const void* lf =
        pos < body.size() ? std::memchr(body.data() + pos, '\n', body.size() - pos) : nullptr;
    if (!lf) break;
    pos = static_cast<const uint8_t*>(lf) - body.data() + 1;
  }
  if (in_preamble) {
    pieces.preamble = body;
  } else if (pieces.parts.size() < max_parts) {
    pieces.parts.push_back(body.From(part_start));
  }
  return pieces;
}

}  // namespace tarnwell::render
