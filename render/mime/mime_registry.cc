#include "render/mime/mime_registry.h"

#include "base/text.h"
#include "render/mime/mime_body.h"
#include "render/mime/mime_encoded_word.h"

namespace tarnwell::render {
namespace {

constexpr std::string_view kMediaTypeNames[] = {"text",        "image",     "audio",  "video",
                                                "application", "multipart", "message"};

struct ExtensionType {
  const char* extension;
  const char* media_type;
};

// First match wins.
constexpr ExtensionType kExtensionTypes[] = {
    {"xml", "application/xml"},
    {"doc", "application/msword"},
    {"rtf", "application/rtf"},
    {"xls", "application/vnd.ms-excel"},
    {"ppt", "application/vnd.ms-powerpoint"},
    {"pdf", "application/pdf"},
    {"zip", "application/zip"},
    {"jpeg", "image/jpeg"},
    {"jpg", "image/jpeg"},
    {"gif", "image/gif"},
    {"tif", "image/tiff"},
    {"tiff", "image/tiff"},
    {"wav", "audio/basic"},
    {"mp3", "audio/basic"},
    {"mpg", "video/mpeg"},
    {"mpeg", "video/mpeg"},
};
constexpr std::string_view kDefaultMediaType = "application/octet-stream";

struct FieldCoderEntry {
  const char* field_name;
  enum { kText, kAddress, kParameter } coder;
};

constexpr FieldCoderEntry kFieldCoders[] = {
    {"Subject", FieldCoderEntry::kText},
    {"Comments", FieldCoderEntry::kText},
    {"Content-Description", FieldCoderEntry::kText},
    {"From", FieldCoderEntry::kAddress},
    {"To", FieldCoderEntry::kAddress},
    {"Resent-To", FieldCoderEntry::kAddress},
    {"Cc", FieldCoderEntry::kAddress},
    {"Resent-Cc", FieldCoderEntry::kAddress},
    {"Bcc", FieldCoderEntry::kAddress},
    {"Resent-Bcc", FieldCoderEntry::kAddress},
    {"Reply-To", FieldCoderEntry::kAddress},
    {"Resent-Reply-To", FieldCoderEntry::kAddress},
    {"Content-Type", FieldCoderEntry::kParameter},
    {"Content-Disposition", FieldCoderEntry::kParameter},
};

std::string_view Trim(std::string_view text) {
  while (!text.empty() && (text.front() == ' ' || text.front() == '\t')) text.remove_prefix(1);
  while (!text.empty() && (text.back() == ' ' || text.back() == '\t')) text.remove_suffix(1);
  return text;
}

}  // namespace

std::string_view MediaTypeName(int media_type) {
  if (media_type < 0 || media_type >= static_cast<int>(std::size(kMediaTypeNames))) return {};
  return kMediaTypeNames[media_type];
}

int MediaTypeFromName(std::string_view main_type) {
  main_type = Trim(main_type);
  for (size_t i = 0; i < std::size(kMediaTypeNames); ++i) {
    if (EqualsIgnoreAsciiCase(main_type, kMediaTypeNames[i])) return static_cast<int>(i);
  }
  return kMediaUnknown;
}

std::string MediaTypeForFileName(std::string_view file_name) {
  const size_t dot = file_name.rfind('.');
  if (dot != std::string_view::npos) {
    const std::string_view extension = file_name.substr(dot + 1);
    for (const ExtensionType& entry : kExtensionTypes) {
      if (EqualsIgnoreAsciiCase(extension, entry.extension)) return entry.media_type;
    }
  }
  return std::string(kDefaultMediaType);
}

std::unique_ptr<CMimeCodeBase> CMimeCoderRegistry::CreateContentCoder(
    std::string_view transfer_encoding) {
  transfer_encoding = Trim(transfer_encoding);
  if (EqualsIgnoreAsciiCase(transfer_encoding, "quoted-printable")) {
    auto coder = std::make_unique<CMimeCodeQP>();
    coder->SetMode(CMimeCodeBase::kModeText);
    return coder;
  }
  if (EqualsIgnoreAsciiCase(transfer_encoding, "base64")) {
    auto coder = std::make_unique<CMimeCodeBase64>();
    coder->SetMode(CMimeCodeBase64::kModeLineBreaks);
    return coder;
  }
  auto coder = std::make_unique<CMimeCodeBase>();
  coder->SetMode(EqualsIgnoreAsciiCase(transfer_encoding, "binary") ? CMimeCodeBase::kModeRaw
                                                                    : CMimeCodeBase::kModeText);
  return coder;
}

std::unique_ptr<CFieldCodeBase> CMimeCoderRegistry::CreateFieldCoder(std::string_view field_name) {
  for (const FieldCoderEntry& entry : kFieldCoders) {
    if (!EqualsIgnoreAsciiCase(field_name, entry.field_name)) continue;
    switch (entry.coder) {
      case FieldCoderEntry::kText:
        return std::make_unique<CFieldCodeText>();
      case FieldCoderEntry::kAddress:
        return std::make_unique<CFieldCodeAddress>();
      case FieldCoderEntry::kParameter:
        return std::make_unique<CFieldCodeParameter>();
    }
  }
  return std::make_unique<CFieldCodeBase>();
}

std::unique_ptr<CMimeBody> CMimeCoderRegistry::CreatePart(std::string_view) {
  return std::make_unique<CMimeBody>();
}

std::string_view CMimeCoderRegistry::DefaultCharset() { return kCharsetUtf8; }

}  // namespace tarnwell::render
