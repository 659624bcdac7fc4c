// Test support for the importers: reading properties back by tag or name, and composing a
// message the way the EML export does, so that composer and importer are tested together.
#ifndef TARNWELL_MAPI_IMPORT_IMPORT_TEST_SUPPORT_H_
#define TARNWELL_MAPI_IMPORT_IMPORT_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/date_time.h"
#include "mapi/property_bag.h"
#include "mapi/property_tags.h"
#include "render/eml_composer.h"
#include "render/mime/mime_sink.h"

namespace tarnwell::mapi::testing {

inline ByteView View(std::string_view s) {
  return ByteView(reinterpret_cast<const uint8_t*>(s.data()), s.size());
}

inline uint64_t Utc(int64_t unix_seconds) { return *UnixTimeToFileTime(unix_seconds); }

inline std::string Str(const PropertyBag& bag, uint16_t id) {
  return bag.String(id).value_or("<absent>");
}

inline const PropertyValue* Named(const PropertyBag& bag, const Guid& set, uint32_t lid) {
  return bag.FindNamed(NamedId(set, lid));
}
inline std::string NamedStr(const PropertyBag& bag, const Guid& set, uint32_t lid) {
  const PropertyValue* v = Named(bag, set, lid);
  return v ? v->AsString().value_or("<not text>") : "<absent>";
}
inline std::optional<uint64_t> NamedTime(const PropertyBag& bag, const Guid& set, uint32_t lid) {
  const PropertyValue* v = Named(bag, set, lid);
  return v ? v->AsSysTime() : std::nullopt;
}
inline std::optional<int32_t> NamedInt(const PropertyBag& bag, const Guid& set, uint32_t lid) {
  const PropertyValue* v = Named(bag, set, lid);
  return v ? v->AsInt32() : std::nullopt;
}

// Each tagged string property holds its text ("<absent>": none).
inline void ExpectStrings(const PropertyBag& bag,
                          std::initializer_list<std::pair<uint16_t, std::string>> want) {
  for (const auto& [id, value] : want) {
    EXPECT_EQ(Str(bag, id), value) << "property 0x" << std::hex << id;
  }
}
// Each named string property of `set` holds its text.
inline void ExpectNamedStrings(const PropertyBag& bag, const Guid& set,
                               std::initializer_list<std::pair<uint32_t, std::string>> want) {
  for (const auto& [lid, value] : want) {
    EXPECT_EQ(NamedStr(bag, set, lid), value) << "named property 0x" << std::hex << lid;
  }
}

inline std::string Compose(const store::MessageRecord& record,
                           std::vector<store::AttachmentRecord> attachments,
                           const render::HeaderStrings& headers, bool store_text = true) {
  std::string out;
  render::StringSink sink(&out);
  render::ComposeOptions options;
  options.store_text = store_text;
  EXPECT_TRUE(
      render::ComposeMessage(record, std::nullopt, attachments, headers, options, &sink).ok());
  return out;
}

}  // namespace tarnwell::mapi::testing

#endif  // TARNWELL_MAPI_IMPORT_IMPORT_TEST_SUPPORT_H_
