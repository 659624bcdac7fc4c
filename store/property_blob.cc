#include "store/property_blob.h"

#include <cstdio>
#include <cstring>
#include <utility>

#include "base/text.h"
#include "engine/catalog_entry.h"
#include "store/real_property_blob.h"

namespace tarnwell::store {

namespace {

constexpr char kMagic[] = {'P', 'r', 'o', 'P'};
constexpr size_t kMagicSize = sizeof(kMagic);
constexpr size_t kCountOffset = 6;
constexpr size_t kHeaderSize = 8;
// Anything shorter cannot hold a header and the start of an entry.
constexpr size_t kMinimumBlobSize = 9;
constexpr size_t kEntrySize = 8;

constexpr uint16_t kKindBoolean = 0x0808;
constexpr uint16_t kKindLong = 0x1818;
constexpr uint16_t kKindTime = 0x3838;
constexpr uint16_t kKindString = 0x4848;
constexpr uint16_t kKindBinary = 0x5050;
constexpr uint16_t kKindMultiString = 0xC8C8;

// A value at an offset: marker byte, length byte, data.
constexpr size_t kValueHeaderSize = 2;
constexpr uint8_t kMarkerUtf8 = 'M';
constexpr uint8_t kMarkerNoValue = 'H';
constexpr uint8_t kMarkerMultiString = 0xC9;
// A multi-valued string item: u16 whose low byte is 'M' and high byte the length.
constexpr size_t kItemHeaderSize = 2;
constexpr uint8_t kItemMarker = 'M';
constexpr char kItemSeparator = ';';

constexpr uint32_t kLongSize = 4;

// Properties the message list takes from a blob.
constexpr uint16_t kPropSenderName = 0x0042;
constexpr uint16_t kPropNormalizedSubject = 0x0E1D;
constexpr uint16_t kPropDisplayCc = 0x0E03;
constexpr uint16_t kPropConversationTopic = 0x0070;

std::string HexId(uint16_t id) {
  char hex[8];
  std::snprintf(hex, sizeof(hex), "%x", id);
  return hex;
}

BlobEntry NewEntry(const char* letters, uint16_t id, uint32_t engine_type) {
  BlobEntry e;
  e.letters = letters;
  e.id = id;
  e.name = e.letters + HexId(id);
  e.engine_type = engine_type;
  return e;
}

// Text that decodes as UTF-8 into fewer characters than it has bytes is
// UTF-8; anything else is taken as ANSI text, which reads plain ASCII the
// same way and keeps stray high bytes readable.
std::string BlobText(ByteView data) {
  const std::string_view raw(reinterpret_cast<const char*>(data.data()), data.size());
  if (Utf16Length(raw) < raw.size()) return ToValidUtf8(raw);
  return CodePageToUtf8(data, kDefaultCodePage);
}

Bytes TextBytes(const std::string& text) { return Bytes(text.begin(), text.end()); }

std::string EntryText(const BlobEntry& e) {
  std::string text(e.value.begin(), e.value.end());
  while (!text.empty() && text.back() == '\0') text.pop_back();
  return text;
}

// The items of a multi-valued string after its marker, joined; false when an
// item is malformed or passes the end of the blob.
bool ReadMultiString(ByteView blob, size_t at, BlobEntry* e) {
  uint8_t count = 0;
  if (!blob.ReadU8(at, &count)) return false;
  size_t pos = at + 1;
  std::string joined;
  for (uint8_t i = 0; i < count; ++i) {
    uint16_t head = 0;
    if (!blob.ReadU16LE(pos, &head) || (head & 0xFF) != kItemMarker) return false;
    const size_t length = head >> 8;
    const ByteView data = blob.Sub(pos + kItemHeaderSize, length);
    if (data.size() != length) return false;
    const std::string item = BlobText(data);
    e->items.push_back(TextBytes(item));
    joined += item;
    joined += kItemSeparator;
    pos += kItemHeaderSize + length;
  }
  if (!joined.empty()) joined.pop_back();
  e->value = TextBytes(joined);
  return true;
}

// Resolves far values when the caller can fetch them.
void ResolveFarValues(const BlobParserOptions& options, std::vector<BlobEntry>* entries) {
  if (!options.separated_value) return;
  for (BlobEntry& e : *entries) {
    if (e.state != BlobValueState::kFarValue) continue;
    std::optional<Bytes> value = options.separated_value(e.far_slot);
    if (value) ResolveFarValue(*value, &e);
  }
}

}  // namespace

std::string SeparatedPropertyColumn(uint16_t slot) {
  char name[32];
  std::snprintf(name, sizeof(name), "SeparatedProperty%02u", unsigned(slot));
  return name;
}

std::vector<BlobEntry> ParseBlobEntries(ByteView blob) {
  std::vector<BlobEntry> entries;
  if (blob.size() < kMinimumBlobSize || std::memcmp(blob.data(), kMagic, kMagicSize) != 0) {
    return entries;
  }
  const uint16_t count = blob.U16LE(kCountOffset);
  for (size_t i = 0; i < count; ++i) {
    const size_t at = kHeaderSize + i * kEntrySize;
    if (!blob.Has(at, kEntrySize)) break;
    const uint16_t kind = blob.U16LE(at);
    const uint16_t id = blob.U16LE(at + 2);
    const uint32_t field = blob.U32LE(at + 4);
    if (kind == kKindBoolean) {
      BlobEntry e = NewEntry("B", id, engine::kColumnBit);
      e.value = {uint8_t(field != 0 ? 1 : 0)};
      entries.push_back(std::move(e));
      continue;
    }
    if (kind == kKindLong) {
      BlobEntry e = NewEntry("L", id, engine::kColumnLong);
      e.value.resize(kLongSize);
      StoreU32LE(e.value.data(), field);
      entries.push_back(std::move(e));
      continue;
    }
    if (kind != kKindTime && kind != kKindString && kind != kKindBinary &&
        kind != kKindMultiString) {
      continue;
    }
    uint8_t marker = 0, length = 0;
    if (!blob.ReadU8(field, &marker) || !blob.ReadU8(size_t(field) + 1, &length)) continue;
    if (kind == kKindString && marker == kMarkerNoValue) break;
    if (kind == kKindMultiString) {
      if (marker != kMarkerMultiString) continue;
      BlobEntry e = NewEntry("MS", id, engine::kColumnText);
      e.code_page = kCodePageUtf8;
      if (ReadMultiString(blob, size_t(field) + 1, &e)) entries.push_back(std::move(e));
      continue;
    }
    const ByteView data = blob.Sub(size_t(field) + kValueHeaderSize, length);
    if (data.size() != length) continue;
    if (kind == kKindString) {
      BlobEntry e = NewEntry("S", id, engine::kColumnText);
      e.code_page = kCodePageUtf8;
      // Markers other than 'M' are not known to mean anything else than
      // 8-bit text.
      e.value = TextBytes(marker == kMarkerUtf8 ? BlobText(data)
                                                : CodePageToUtf8(data, kDefaultCodePage));
      entries.push_back(std::move(e));
    } else if (kind == kKindTime) {
      BlobEntry e = NewEntry("T", id, engine::kColumnLongLong);
      e.value = data.ToBytes();
      entries.push_back(std::move(e));
    } else {
      BlobEntry e = NewEntry("N", id, engine::kColumnBinary);
      e.value = data.ToBytes();
      entries.push_back(std::move(e));
    }
  }
  return entries;
}

std::vector<BlobEntry> ReadBlobEntries(ByteView blob) {
  return IsRealLayout(blob) ? ParseRealBlobEntries(blob) : ParseBlobEntries(blob);
}

int ParseBlobForList(ByteView blob, const BlobParserOptions& options, MessageSummary* summary) {
  if (summary == nullptr) return 0;
  std::vector<BlobEntry> entries = ReadBlobEntries(blob);
  ResolveFarValues(options, &entries);
  auto text_of = [&](uint16_t id, std::string* out) {
    for (const BlobEntry& e : entries) {
      if (e.letters == "S" && e.id == id && e.state == BlobValueState::kValue) {
        *out = EntryText(e);
        return true;
      }
    }
    return false;
  };
  std::string text;
  const bool has_sender = text_of(kPropSenderName, &text);
  if (has_sender) summary->sender = text;
  const bool has_subject = text_of(kPropNormalizedSubject, &text);
  if (has_subject) summary->subject += text;
  if (!options.later_2013_variant) return 1;

  if (text_of(kPropDisplayCc, &text)) summary->cc = text;
  if (!has_sender && text_of(kPropSenderName, &text)) summary->sender = text;
  // Items without a normalized subject still have their conversation topic.
  if (!has_subject && text_of(kPropConversationTopic, &text)) summary->subject += text;
  return 1;
}

int ParseBlobForDetail(const PropertyDecoder& decoder, DecodePurpose purpose, ByteView blob,
                       const BlobParserOptions& options, ItemRecords* records) {
  if (records == nullptr) return 0;
  std::vector<BlobEntry> entries = ReadBlobEntries(blob);
  ResolveFarValues(options, &entries);
  for (const BlobEntry& e : entries) {
    if (e.state != BlobValueState::kValue) continue;
    decoder.Decode(purpose, e.name, e.engine_type, e.code_page, e.value, records);
  }
  return 1;
}

PropertyBlobParser MakePropertyBlobParser(const PropertyDecoder* decoder,
                                          BlobParserOptions options) {
  return [decoder, options = std::move(options)](DecodePurpose purpose, ByteView blob,
                                                 ItemRecords* records) -> int {
    if (records == nullptr) return 0;
    switch (purpose) {
      case DecodePurpose::kMessageListRow:
        return ParseBlobForList(blob, options, &records->summary);
      case DecodePurpose::kMessageDetail:
      case DecodePurpose::kContactDetail:
      case DecodePurpose::kAppointmentDetail:
      case DecodePurpose::kTaskDetail:
        return decoder ? ParseBlobForDetail(*decoder, purpose, blob, options, records) : 0;
      default:
        return 0;
    }
  };
}

void InstallPropertyBlobParser(PropertyDecoder* decoder, BlobParserOptions options) {
  if (decoder == nullptr) return;
  decoder->SetPropertyBlobParser(MakePropertyBlobParser(decoder, std::move(options)));
}

}  // namespace tarnwell::store
