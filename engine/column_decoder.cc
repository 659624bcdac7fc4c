#include "engine/column_decoder.h"

#include <cmath>
#include <cstdio>
#include <cstring>
#include <ctime>

#include "base/text.h"
#include "engine/compress/compressed_value.h"

namespace tarnwell::engine {
namespace {

constexpr uint32_t kUtf16CodePage = 1200;
constexpr uint16_t kMultiSeparatedBit = 0x8000;
constexpr uint16_t kMultiOffsetMask = 0x7FFF;
constexpr size_t kGuidSize = 16;
constexpr double kOleEpochToUnixDays = 25569.0;  // 1899-12-30 to 1970-01-01
constexpr double kSecondsPerDay = 86400.0;

DecodedColumn Damaged(std::string why, ByteView bytes = ByteView()) {
  DecodedColumn d;
  d.kind = DecodedColumn::Kind::kDamaged;
  d.text = std::move(why);
  d.bytes = bytes.ToBytes();
  return d;
}

int64_t SignExtend(uint64_t v, size_t width) {
  if (width >= 8) return int64_t(v);
  const uint64_t sign = uint64_t(1) << (8 * width - 1);
  return int64_t((v ^ sign) - sign);
}

}  // namespace

std::string GuidText(ByteView b) {
  if (b.size() != kGuidSize) return ToHex(b);
  char buf[40];
  std::snprintf(buf, sizeof buf, "%08x-%04x-%04x-%02x%02x-%02x%02x%02x%02x%02x%02x",
                LoadU32LE(b.data()), LoadU16LE(b.data() + 4), LoadU16LE(b.data() + 6), b[8], b[9],
                b[10], b[11], b[12], b[13], b[14], b[15]);
  return buf;
}

std::string OleDateText(double days) {
  if (!std::isfinite(days)) return "invalid date";
  const double seconds = std::round((days - kOleEpochToUnixDays) * kSecondsPerDay);
  // Outside years 1..9999 there is nothing sensible to print.
  if (seconds < -62135596800.0 || seconds > 253402300799.0) return "invalid date";
  time_t t = time_t(seconds);
  std::tm tm{};
  if (!gmtime_r(&t, &tm)) return "invalid date";
  char buf[32];
  std::strftime(buf, sizeof buf, "%Y-%m-%d %H:%M:%S", &tm);
  return buf;
}

DecodedColumn ColumnDecoder::Decode(const CatalogEntry& column, const ColumnValue& value) const {
  if (!value.filled || !value.present) return DecodedColumn();
  const uint8_t flags = value.has_flag_byte ? value.flag_byte : 0;
  const bool separated = flags & kTaggedSeparated;
  const bool compressed = flags & kTaggedCompressed;
  ByteView bytes = value.value;

  if (flags & kTaggedTwoValues) {
    DecodedColumn multi;
    multi.kind = DecodedColumn::Kind::kMulti;
    if (bytes.empty()) return Damaged("two-value column without length", bytes);
    const size_t first = bytes[0];
    if (!bytes.Has(1, first)) return Damaged("two-value column: first value too long", bytes);
    multi.values.push_back(DecodeElement(column, bytes.Sub(1, first), false, false));
    multi.values.push_back(DecodeElement(column, bytes.From(1 + first), false, false));
    return multi;
  }
  if (flags & kTaggedMultiValued) {
    DecodedColumn multi;
    multi.kind = DecodedColumn::Kind::kMulti;
    uint16_t first = 0;
    if (!bytes.ReadU16LE(0, &first)) return Damaged("multi-valued column without offsets", bytes);
    const size_t count = (first & kMultiOffsetMask) / 2;
    if (count == 0 || !bytes.Has(0, 2 * count)) return Damaged("multi-valued offsets", bytes);
    for (size_t k = 0; k < count; ++k) {
      const uint16_t word = bytes.U16LE(2 * k);
      const size_t begin = word & kMultiOffsetMask;
      const size_t end =
          k + 1 < count ? (bytes.U16LE(2 * (k + 1)) & kMultiOffsetMask) : bytes.size();
      if (begin > end || end > bytes.size()) {
        multi.values.push_back(Damaged("multi-valued element outside the value"));
        break;
      }
      multi.values.push_back(
          DecodeElement(column, bytes.Sub(begin, end - begin), word & kMultiSeparatedBit, false));
    }
    return multi;
  }
  return DecodeElement(column, bytes, separated, compressed);
}

DecodedColumn ColumnDecoder::DecodeElement(const CatalogEntry& column, ByteView bytes,
                                           bool separated, bool compressed) const {
  Bytes owned;
  bool utf16 = column.code_page == kUtf16CodePage;
  if (separated) {
    if (!long_values_ || lv_root_ == 0) return Damaged("long value without a long-value tree");
    LongValue lv;
    if (long_values_->Read(lv_root_, bytes, &lv) != 0) {
      return Damaged("long value " + ToHex(bytes) + " not found");
    }
    Status s = long_values_->ReadAll(lv, &owned);
    if (!s.ok()) return Damaged(s.ToString(), ByteView(owned));
    if (lv.truncated) return Damaged("long value is missing chunks", ByteView(owned));
    bytes = ByteView(owned);
  } else if (compressed) {
    DecodedValue d = DecodeCompressedValue(bytes);
    if (d.status == DecodeStatus::kUnsupported) {
      DecodedColumn u;
      u.kind = DecodedColumn::Kind::kUnsupported;
      u.text = "unsupported compression: " + std::string(SchemeName(d.scheme));
      return u;
    }
    if (d.status == DecodeStatus::kScrubbed) return Damaged("scrubbed value");
    if (!d.ok()) return Damaged("compressed value: " + d.message, ByteView(d.bytes));
    owned = std::move(d.bytes);
    bytes = ByteView(owned);
    if (d.is_utf16)
      utf16 = true;
    else if (d.scheme == CompressionScheme::kSevenBitAscii)
      utf16 = false;
  }
  return Interpret(column, bytes, utf16);
}

DecodedColumn ColumnDecoder::Interpret(const CatalogEntry& column, ByteView b, bool utf16) const {
  DecodedColumn d;
  auto fixed = [&](size_t width) -> bool {
    if (b.size() == width) return true;
    d = Damaged("value of " + std::to_string(b.size()) + " bytes where " + std::to_string(width) +
                    " belong",
                b);
    return false;
  };
  auto little = [&](size_t width) {
    uint64_t v = 0;
    for (size_t k = width; k-- > 0;) v = (v << 8) | b[k];
    return v;
  };
  switch (column.column_type()) {
    case kColumnBit:
      if (!fixed(1)) return d;
      d.kind = DecodedColumn::Kind::kBool;
      d.b = b[0] != 0;  // true is stored as 0xFF, sometimes as 0x01
      return d;
    case kColumnUnsignedByte:
    case kColumnUnsignedShort:
    case kColumnUnsignedLong: {
      const size_t w = column.column_type() == kColumnUnsignedByte    ? 1
                       : column.column_type() == kColumnUnsignedShort ? 2
                                                                      : 4;
      if (!fixed(w)) return d;
      d.kind = DecodedColumn::Kind::kUnsigned;
      d.u = little(w);
      return d;
    }
    case kColumnShort:
    case kColumnLong:
    case kColumnCurrency:
    case kColumnLongLong: {
      const size_t w = column.column_type() == kColumnShort  ? 2
                       : column.column_type() == kColumnLong ? 4
                                                             : 8;
      if (!fixed(w)) return d;
      d.kind = DecodedColumn::Kind::kSigned;
      d.i = SignExtend(little(w), w);
      return d;
    }
    case kColumnFloat: {
      if (!fixed(4)) return d;
      uint32_t bits = uint32_t(little(4));
      float f;
      std::memcpy(&f, &bits, sizeof f);
      d.kind = DecodedColumn::Kind::kDouble;
      d.d = f;
      return d;
    }
    case kColumnDouble:
    case kColumnDateTime: {
      if (!fixed(8)) return d;
      uint64_t bits = little(8);
      std::memcpy(&d.d, &bits, sizeof d.d);
      if (column.column_type() == kColumnDateTime) {
        d.kind = DecodedColumn::Kind::kDateTime;
        d.text = OleDateText(d.d);
      } else {
        d.kind = DecodedColumn::Kind::kDouble;
      }
      return d;
    }
    case kColumnGuid:
      if (!fixed(kGuidSize)) return d;
      d.kind = DecodedColumn::Kind::kGuid;
      d.text = GuidText(b);
      return d;
    case kColumnText:
    case kColumnLongText:
      d.kind = DecodedColumn::Kind::kText;
      // A terminating NUL is not part of the text.
      d.text = utf16 ? Utf16LEToUtf8(b)
                     : CodePageToUtf8(b, column.code_page ? column.code_page : kDefaultCodePage);
      while (!d.text.empty() && d.text.back() == '\0') d.text.pop_back();
      return d;
    default:
      d.kind = DecodedColumn::Kind::kBinary;
      d.bytes = b.ToBytes();
      return d;
  }
}

}  // namespace tarnwell::engine
