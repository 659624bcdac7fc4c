#include "store/real_property_blob.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "base/text.h"
#include "engine/catalog_entry.h"

namespace tarnwell::store {

namespace {

constexpr char kMagic[] = {'P', 'r', 'o', 'P'};
constexpr size_t kMagicSize = sizeof(kMagic);
constexpr size_t kFlagsOffset = 4;
constexpr size_t kCountOffset = 6;
constexpr size_t kHeaderSize = 8;
constexpr size_t kNearAreaOffsetSize = 4;
constexpr uint16_t kFlagsPlain = 0x0400;
constexpr uint16_t kFlagsWithNearArea = 0x0401;
constexpr size_t kEntrySize = 3;

constexpr uint8_t kMultiValued = 0x80;

// Entry types.
constexpr uint8_t kTypeBool = 0x08;
constexpr uint8_t kTypeInt16 = 0x10;
constexpr uint8_t kTypeInt32 = 0x18;
constexpr uint8_t kTypeInt64 = 0x20;
constexpr uint8_t kTypeCurrency = 0x24;
constexpr uint8_t kTypeFloat = 0x28;
constexpr uint8_t kTypeDouble = 0x30;
constexpr uint8_t kTypeAppTime = 0x34;
constexpr uint8_t kTypeTime = 0x38;
constexpr uint8_t kTypeGuid = 0x40;
constexpr uint8_t kTypeString = 0x48;
constexpr uint8_t kTypeBinary = 0x50;

// Encodings that are not a value of the entry's own type.
constexpr uint8_t kEncodingDeleted = 0x00;
constexpr uint8_t kEncodingNear = 0x78;
constexpr uint8_t kEncodingFar = 0x7A;
// After 0x78 / 0x7A: u16 slot, u32 offset or size hint, u16 family, u32 length.
constexpr size_t kReferenceSize = 12;

// Encodings of single values.
constexpr uint8_t kBoolFalse = 0x08;
constexpr uint8_t kBoolTrue = 0x09;
constexpr uint8_t kInt16Zero = 0x10, kInt16Byte = 0x11, kInt16Word = 0x12;
constexpr uint8_t kInt32Zero = 0x18, kInt32Byte = 0x19, kInt32Word = 0x1A, kInt32Full = 0x1B;
constexpr uint8_t kInt64Zero = 0x20, kInt64Byte = 0x21, kInt64Word = 0x22, kInt64Dword = 0x23,
                  kInt64Full = 0x24;
constexpr uint8_t kFloatFull = 0x28, kFloatZero = 0x2A;
constexpr uint8_t kDoubleFull = 0x30, kDoubleZero = 0x32;
constexpr uint8_t kTimeFull = 0x38, kTimeShort = 0x39;
constexpr uint8_t kGuidFull = 0x40;
constexpr uint8_t kStringEmpty = 0x48, kString16Byte = 0x49, kString16Word = 0x4A,
                  kString8Byte = 0x4D, kString8Word = 0x4E;
constexpr uint8_t kBinaryEmpty = 0x50, kBinaryByte = 0x51, kBinaryWord = 0x52;
// Multi-valued: the type with +1 (u8 element count) or +2 (u16 count).
constexpr uint8_t kMultiByteCount = 1, kMultiWordCount = 2;

constexpr size_t kShortTimeSize = 4;
constexpr size_t kGuidSize = 16;
constexpr uint32_t kEightBitCodePage = 1252;

struct TypeInfo {
  uint8_t type;
  uint8_t family;  // whose encodings the type's values use
  char letter;
  size_t element_size;  // packed size in a multi-valued entry; 0: own encoding byte
  uint32_t engine_type;
};

constexpr TypeInfo kTypes[] = {
    {kTypeBool, kTypeBool, 'B', 1, engine::kColumnBit},
    {kTypeInt16, kTypeInt16, 'I', 2, engine::kColumnShort},
    {kTypeInt32, kTypeInt32, 'L', 4, engine::kColumnLong},
    {kTypeInt64, kTypeInt64, 'Q', 8, engine::kColumnLongLong},
    {kTypeCurrency, kTypeInt64, 'Q', 8, engine::kColumnCurrency},
    {kTypeFloat, kTypeFloat, 'D', 4, engine::kColumnFloat},
    {kTypeDouble, kTypeDouble, 'D', 8, engine::kColumnDouble},
    {kTypeAppTime, kTypeDouble, 'D', 8, engine::kColumnDouble},
    {kTypeTime, kTypeTime, 'T', 8, engine::kColumnLongLong},
    {kTypeGuid, kTypeGuid, 'G', kGuidSize, engine::kColumnGuid},
    {kTypeString, kTypeString, 'S', 0, engine::kColumnText},
    {kTypeBinary, kTypeBinary, 'N', 0, engine::kColumnBinary},
};

const TypeInfo* FindType(uint8_t base_type) {
  for (const TypeInfo& t : kTypes) {
    if (t.type == base_type) return &t;
  }
  return nullptr;
}

// Reads forward through a view; every read is checked.
class Cursor {
 public:
  explicit Cursor(ByteView bytes, size_t pos = 0) : bytes_(bytes), pos_(pos) {}
  size_t pos() const { return pos_; }
  size_t left() const { return pos_ <= bytes_.size() ? bytes_.size() - pos_ : 0; }
  bool Take(size_t n, ByteView* out) {
    if (!bytes_.Has(pos_, n)) return false;
    *out = bytes_.Sub(pos_, n);
    pos_ += n;
    return true;
  }
  bool U8(uint8_t* v) { return Advance(bytes_.ReadU8(pos_, v), 1); }
  bool U16(uint16_t* v) { return Advance(bytes_.ReadU16LE(pos_, v), 2); }
  bool U32(uint32_t* v) { return Advance(bytes_.ReadU32LE(pos_, v), 4); }

 private:
  bool Advance(bool ok, size_t n) {
    if (ok) pos_ += n;
    return ok;
  }
  ByteView bytes_;
  size_t pos_;
};

Bytes LittleEndian(uint64_t v, size_t width) {
  Bytes out(width);
  for (size_t i = 0; i < width; ++i) out[i] = uint8_t(v >> (8 * i));
  return out;
}

// `width` bytes read little-endian and sign-extended.
bool ReadSigned(Cursor* c, size_t width, int64_t* out) {
  ByteView b;
  if (!c->Take(width, &b)) return false;
  uint64_t v = 0;
  for (size_t i = 0; i < width; ++i) v |= uint64_t(b[i]) << (8 * i);
  const unsigned shift = unsigned(64 - 8 * width);
  *out = shift == 0 ? int64_t(v) : int64_t(v << shift) >> shift;
  return true;
}

Bytes TextBytes(const std::string& text) { return Bytes(text.begin(), text.end()); }

// The element or value that follows an encoding byte of a string or binary.
bool ReadCounted(Cursor* c, bool word_count, ByteView* out) {
  size_t n = 0;
  if (word_count) {
    uint16_t v = 0;
    if (!c->U16(&v)) return false;
    n = v;
  } else {
    uint8_t v = 0;
    if (!c->U8(&v)) return false;
    n = v;
  }
  return c->Take(n, out);
}

// One value of encoding family `base_type` (no multi-valued bit) that starts
// with encoding byte `enc`. Sets *value; *unknown for an encoding whose meaning is unknown.
bool ReadScalar(uint8_t base_type, uint8_t enc, Cursor* c, Bytes* value, bool* unknown,
                std::string* problem) {
  *unknown = false;
  int64_t v = 0;
  ByteView b;
  auto bad = [&]() {
    char text[64];
    std::snprintf(text, sizeof(text), "encoding 0x%02x does not fit type 0x%02x", enc, base_type);
    *problem = text;
    return false;
  };
  auto cut = [&]() {
    *problem = "value passes the end of the blob";
    return false;
  };
  switch (base_type) {
    case kTypeBool:
      if (enc != kBoolFalse && enc != kBoolTrue) return bad();
      *value = {uint8_t(enc == kBoolTrue ? 1 : 0)};
      return true;
    case kTypeInt16:
      if (enc == kInt16Zero) {
        v = 0;
      } else if (enc == kInt16Byte || enc == kInt16Word) {
        if (!ReadSigned(c, enc == kInt16Byte ? 1 : 2, &v)) return cut();
      } else {
        return bad();
      }
      *value = LittleEndian(uint64_t(v), 2);
      return true;
    case kTypeInt32:
      if (enc == kInt32Zero) {
        v = 0;
      } else if (enc == kInt32Byte || enc == kInt32Word || enc == kInt32Full) {
        const size_t width = enc == kInt32Byte ? 1 : enc == kInt32Word ? 2 : 4;
        if (!ReadSigned(c, width, &v)) return cut();
      } else {
        return bad();
      }
      *value = LittleEndian(uint64_t(v), 4);
      return true;
    case kTypeInt64:
      if (enc == kInt64Zero) {
        v = 0;
      } else if (enc >= kInt64Byte && enc <= kInt64Full) {
        const size_t width = size_t(1) << (enc - kInt64Byte);
        if (!ReadSigned(c, width, &v)) return cut();
      } else {
        return bad();
      }
      *value = LittleEndian(uint64_t(v), 8);
      return true;
    case kTypeFloat:
      if (enc == kFloatZero) {
        *value = Bytes(4, 0);
        return true;
      }
      if (enc != kFloatFull) return bad();
      if (!c->Take(4, &b)) return cut();
      *value = b.ToBytes();
      return true;
    case kTypeDouble:
      if (enc == kDoubleZero) {
        *value = Bytes(8, 0);
        return true;
      }
      if (enc != kDoubleFull) return bad();
      if (!c->Take(8, &b)) return cut();
      *value = b.ToBytes();
      return true;
    case kTypeTime:
      if (enc == kTimeShort) {
        // Seen in real blobs; what the four bytes mean is not known, so they
        // are kept as they are rather than read as a time.
        if (!c->Take(kShortTimeSize, &b)) return cut();
        *value = b.ToBytes();
        *unknown = true;
        return true;
      }
      if (enc != kTimeFull) return bad();
      if (!c->Take(8, &b)) return cut();
      *value = b.ToBytes();
      return true;
    case kTypeGuid:
      if (enc != kGuidFull) return bad();
      if (!c->Take(kGuidSize, &b)) return cut();
      *value = b.ToBytes();
      return true;
    case kTypeString:
      switch (enc) {
        case kStringEmpty:
          value->clear();
          return true;
        case kString8Byte:
        case kString8Word:
          if (!ReadCounted(c, enc == kString8Word, &b)) return cut();
          *value = TextBytes(CodePageToUtf8(b, kEightBitCodePage));
          return true;
        case kString16Byte:
        case kString16Word:
          if (!ReadCounted(c, enc == kString16Word, &b)) return cut();
          *value = TextBytes(Utf16LEToUtf8(b));
          return true;
        default:
          return bad();
      }
    case kTypeBinary:
      if (enc == kBinaryEmpty) {
        value->clear();
        return true;
      }
      if (enc != kBinaryByte && enc != kBinaryWord) return bad();
      if (!ReadCounted(c, enc == kBinaryWord, &b)) return cut();
      *value = b.ToBytes();
      return true;
    default:
      *problem = "unknown type";
      return false;
  }
}

// A value of the entry's type (single or multi-valued) from its encoding byte
// on. Fills value, items and state.
bool ReadValue(const TypeInfo& info, bool multi, Cursor* c, BlobEntry* e, std::string* problem) {
  uint8_t enc = 0;
  if (!c->U8(&enc)) {
    *problem = "value passes the end of the blob";
    return false;
  }
  if (!multi) {
    bool unknown = false;
    if (!ReadScalar(info.family, enc, c, &e->value, &unknown, problem)) return false;
    e->state = unknown ? BlobValueState::kUnknownEncoding : BlobValueState::kValue;
    if (unknown) e->engine_type = engine::kColumnBinary;
    return true;
  }
  const uint8_t mv_type = info.family | kMultiValued;
  size_t count = 0;
  if (enc == mv_type + kMultiByteCount) {
    uint8_t n = 0;
    if (!c->U8(&n)) return *problem = "value passes the end of the blob", false;
    count = n;
  } else if (enc == mv_type + kMultiWordCount) {
    uint16_t n = 0;
    if (!c->U16(&n)) return *problem = "value passes the end of the blob", false;
    count = n;
  } else {
    char text[64];
    std::snprintf(text, sizeof(text), "encoding 0x%02x does not fit type 0x%02x", enc, mv_type);
    *problem = text;
    return false;
  }
  std::vector<Bytes> items;
  if (info.element_size > 0) {
    ByteView packed;
    if (count > c->left() / info.element_size || !c->Take(count * info.element_size, &packed)) {
      *problem = "element count passes the end of the blob";
      return false;
    }
    for (size_t i = 0; i < count; ++i) {
      items.push_back(packed.Sub(i * info.element_size, info.element_size).ToBytes());
    }
    e->value = packed.ToBytes();
    e->engine_type = engine::kColumnBinary;
  } else {
    // Every element has at least its encoding byte.
    if (count > c->left()) {
      *problem = "element count passes the end of the blob";
      return false;
    }
    for (size_t i = 0; i < count; ++i) {
      uint8_t item_enc = 0;
      Bytes item;
      bool unknown = false;
      if (!c->U8(&item_enc) || !ReadScalar(info.family, item_enc, c, &item, &unknown, problem)) {
        if (problem->empty()) *problem = "value passes the end of the blob";
        return false;
      }
      items.push_back(std::move(item));
    }
    if (info.type == kTypeString) {
      // Strings are also offered as one text, the way the decoder takes a
      // multi-valued string column.
      std::string joined;
      for (const Bytes& item : items) {
        joined.append(item.begin(), item.end());
        joined += ';';
      }
      if (!joined.empty()) joined.pop_back();
      e->value = TextBytes(joined);
    } else {
      e->value.clear();
      e->engine_type = engine::kColumnBinary;
    }
  }
  e->items = std::move(items);
  e->state = BlobValueState::kValue;
  return true;
}

// Sets names and the value's column type from the entry's type byte; false
// for a type this layout does not have.
bool StartEntry(uint8_t type, uint16_t id, BlobEntry* e) {
  const TypeInfo* info = FindType(type & ~kMultiValued);
  if (info == nullptr) return false;
  e->type = type;
  e->id = id;
  e->letters =
      (type & kMultiValued) ? std::string("M") + info->letter : std::string(1, info->letter);
  char hex[8];
  std::snprintf(hex, sizeof(hex), "%x", id);
  e->name = e->letters + hex;
  e->engine_type = info->engine_type;
  e->code_page = info->type == kTypeString ? kCodePageUtf8 : 0;
  return true;
}

// Decodes an encoded value lying wholly in `encoded`; it has to fill it.
bool ReadEncoded(ByteView encoded, BlobEntry* e, std::string* problem) {
  const TypeInfo* info = FindType(e->type & ~kMultiValued);
  if (info == nullptr) return false;
  Cursor c(encoded);
  BlobEntry filled = *e;
  if (!ReadValue(*info, (e->type & kMultiValued) != 0, &c, &filled, problem)) return false;
  if (c.left() != 0) {
    *problem = "encoded value longer than its contents";
    return false;
  }
  *e = std::move(filled);
  return true;
}

}  // namespace

bool IsRealLayout(ByteView blob) {
  if (!blob.Has(0, kHeaderSize) || std::memcmp(blob.data(), kMagic, kMagicSize) != 0) {
    return false;
  }
  const uint16_t flags = blob.U16LE(kFlagsOffset);
  return flags == kFlagsPlain || flags == kFlagsWithNearArea;
}

namespace {

RealBlob Parse(ByteView blob, bool trailing_bytes_allowed) {
  RealBlob out;
  if (!IsRealLayout(blob)) {
    out.problem = "not a property blob of this layout";
    return out;
  }
  const uint16_t count = blob.U16LE(kCountOffset);
  size_t pos = kHeaderSize;
  // Inline values end where the near-value area starts.
  size_t values_end = blob.size();
  if (blob.U16LE(kFlagsOffset) == kFlagsWithNearArea) {
    uint32_t near_start = 0;
    if (!blob.ReadU32LE(pos, &near_start)) {
      out.problem = "header passes the end of the blob";
      return out;
    }
    pos += kNearAreaOffsetSize;
    if (near_start < pos || near_start > blob.size()) {
      out.problem = "near-value area outside the blob";
      return out;
    }
    values_end = near_start;
  }
  const ByteView area = blob.Sub(0, values_end);
  if (!area.Has(pos, size_t(count) * kEntrySize)) {
    out.problem = "entry table passes the end of the blob";
    return out;
  }
  Cursor values(area, pos + size_t(count) * kEntrySize);
  size_t near_end = values_end;
  for (size_t i = 0; i < count; ++i) {
    const size_t at = pos + i * kEntrySize;
    BlobEntry e;
    if (!StartEntry(area[at], area.U16LE(at + 1), &e)) {
      char text[48];
      std::snprintf(text, sizeof(text), "entry %zu has unknown type 0x%02x", i, area[at]);
      out.problem = text;
      return out;
    }
    const TypeInfo* info = FindType(e.type & ~kMultiValued);
    const bool multi = (e.type & kMultiValued) != 0;
    uint8_t enc = 0;
    if (!area.ReadU8(values.pos(), &enc)) {
      out.problem = "value of " + e.name + " passes the end of the blob";
      return out;
    }
    std::string problem;
    if (enc == kEncodingDeleted) {
      values.U8(&enc);
      e.state = BlobValueState::kDeleted;
    } else if (enc == kEncodingNear || enc == kEncodingFar) {
      values.U8(&enc);
      ByteView ref;
      if (!values.Take(kReferenceSize, &ref)) {
        out.problem = "reference of " + e.name + " passes the end of the blob";
        return out;
      }
      const uint16_t slot = ref.U16LE(0);
      const uint32_t where = ref.U32LE(2);
      const uint16_t family = ref.U16LE(6);
      const uint32_t length = ref.U32LE(8);
      if (enc == kEncodingFar) {
        e.state = BlobValueState::kFarValue;
        e.far_slot = slot;
        e.far_family = family;
        e.far_length = length;
      } else {
        if (!blob.Has(where, length) || where < values_end) {
          out.problem = "near value of " + e.name + " outside the near-value area";
          return out;
        }
        if (!ReadEncoded(blob.Sub(where, length), &e, &problem)) {
          out.problem = "near value of " + e.name + ": " + problem;
          return out;
        }
        near_end = std::max(near_end, size_t(where) + length);
      }
    } else if (!ReadValue(*info, multi, &values, &e, &problem)) {
      out.problem = "value of " + e.name + ": " + problem;
      return out;
    }
    out.entries.push_back(std::move(e));
  }
  const bool has_near_area = blob.U16LE(kFlagsOffset) == kFlagsWithNearArea;
  out.used = has_near_area ? near_end : values.pos();
  if (values.pos() != values_end && (has_near_area || !trailing_bytes_allowed)) {
    out.problem = "bytes left after the last value";
    return out;
  }
  if (near_end != blob.size() && !trailing_bytes_allowed) {
    out.problem = "bytes left after the last near value";
    return out;
  }
  out.complete = true;
  return out;
}

}  // namespace

RealBlob ParseRealBlob(ByteView blob) { return Parse(blob, false); }

RealBlob ParseRealBlobPrefix(ByteView bytes) { return Parse(bytes, true); }

std::vector<BlobEntry> ParseRealBlobEntries(ByteView blob) { return ParseRealBlob(blob).entries; }

bool ResolveFarValue(ByteView separated_value, BlobEntry* entry) {
  if (entry == nullptr || entry->state != BlobValueState::kFarValue) return false;
  BlobEntry resolved = *entry;
  std::string problem;
  if (!ReadEncoded(separated_value, &resolved, &problem)) return false;
  *entry = std::move(resolved);
  return true;
}

}  // namespace tarnwell::store
