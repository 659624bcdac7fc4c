// Which coder handles which header field and transfer encoding, the part factory, and the
// media type a file name implies.
//
// The tables are fixed at compile time, so lookups are safe from any thread.
#ifndef TARNWELL_RENDER_MIME_MIME_REGISTRY_H_
#define TARNWELL_RENDER_MIME_MIME_REGISTRY_H_

#include <memory>
#include <string>
#include <string_view>

#include "render/mime/mime_codes.h"
#include "render/mime/mime_field_codes.h"

namespace tarnwell::render {

class CMimeBody;

// Main media types, in the order GetMediaType numbers them.
enum MediaType : int {
  kMediaText = 0,
  kMediaImage,
  kMediaAudio,
  kMediaVideo,
  kMediaApplication,
  kMediaMultipart,
  kMediaMessage,
  kMediaUnknown = -1,
};

// "text", "image", ...; "" for kMediaUnknown.
std::string_view MediaTypeName(int media_type);
// Index of a main type (case-insensitive), or kMediaUnknown.
int MediaTypeFromName(std::string_view main_type);
// "image/jpeg" for "photo.JPG"; "application/octet-stream" when the extension is missing or
// not in the table.
std::string MediaTypeForFileName(std::string_view file_name);

class CMimeCoderRegistry {
 public:
  // The content coder for a Content-Transfer-Encoding value (case-insensitive; blanks
  // around it ignored). "" means 7bit.
  static std::unique_ptr<CMimeCodeBase> CreateContentCoder(std::string_view transfer_encoding);
  // The value coder for a header field name (case-insensitive).
  static std::unique_ptr<CFieldCodeBase> CreateFieldCoder(std::string_view field_name);
  // A new child part for a media type; every type gets a plain CMimeBody.
  static std::unique_ptr<CMimeBody> CreatePart(std::string_view media_type);
  // Charset of encoded words in fields that name none.
  static std::string_view DefaultCharset();
};

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_MIME_MIME_REGISTRY_H_
