#include "testing/forge_sample.h"

#include <cstring>
#include <string>

#include "testing/forge_record.h"

namespace tarnwell::forge {
namespace {

constexpr uint32_t kCodepageWestern = 1252;
constexpr uint32_t kCodepageUtf16 = 1200;
constexpr uint64_t kFiletime2013 = 130157856000000000ull;  // 2013-06-15 00:00:00 UTC
// A little over a day, so dates cover months and single-digit days.
constexpr uint64_t kFiletimeStep = 25 * 36000000000ull + 1234567;
constexpr uint8_t kBitTrue = 0xFF;

// Every n-th row gets a NULL or loses a value, so nulls land on every page.
constexpr uint32_t kNullNameEvery = 7;
constexpr uint32_t kNoBlobEvery = 5;
constexpr uint32_t kDeletedEvery = 13;

Bytes Double(double d) {
  uint64_t bits;
  std::memcpy(&bits, &d, sizeof bits);
  return LittleEndian(bits, 8);
}

Bytes Float(float f) {
  uint32_t bits;
  std::memcpy(&bits, &f, sizeof bits);
  return LittleEndian(bits, 4);
}

TableLayout ItemsTable(const SampleOptions& options) {
  TableLayout t;
  t.name = "Items";
  t.max_rows_per_leaf = options.max_rows_per_leaf;
  t.max_children_per_branch = options.max_children_per_branch;
  t.columns = {
      {1, "Flag", kColumnBit},
      {2, "Small", kColumnUnsignedByte},
      {3, "Short", kColumnShort},
      {4, "Long", kColumnLong},
      {5, "Money", kColumnCurrency},
      {6, "Single", kColumnFloat},
      {7, "Double", kColumnDouble},
      {8, "When", kColumnDateTime},
      {9, "Unsigned", kColumnUnsignedLong},
      {10, "LongLong", kColumnLongLong},
      {11, "Guid", kColumnGuid},
      {12, "UShort", kColumnUnsignedShort},
      {128, "Name", kColumnText, 255, kCodepageWestern},
      {129, "Blob", kColumnBinary, 255},
      {130, "Subject", kColumnText, 255, kCodepageUtf16},
      {256, "Body", kColumnLongText, 0, kCodepageUtf16},
      {257, "Data", kColumnLongBinary},
  };
  for (uint32_t i = 1; i <= options.rows; ++i) {
    RowLayout row;
    auto add = [&row](uint32_t id, Bytes v, uint8_t flags = 0) {
      row.cells.push_back({id, std::move(v), flags});
    };
    add(1, LittleEndian(i % 2 ? kBitTrue : 0, 1));
    add(2, LittleEndian(i * 7 % 256, 1));
    add(3, LittleEndian(uint16_t(int16_t(1000 - int(i) * 37)), 2));
    add(4, LittleEndian(uint32_t(int32_t(i * 100003) * (i % 3 ? 1 : -1)), 4));
    add(5, LittleEndian(uint64_t(int64_t(i) * 12345 - 50000), 8));
    add(6, Float(float(i) + 0.5f));
    add(7, Double(double(i) / 4.0 - 3.25));
    add(8, LittleEndian(kFiletime2013 + i * kFiletimeStep, 8));
    add(9, LittleEndian(0xFFFF0000u + i, 4));
    add(10, LittleEndian(uint64_t(int64_t(i) * -9876543210ll), 8));
    Bytes guid(16);
    for (int b = 0; b < 16; ++b) guid[b] = uint8_t(i * 16 + b);
    add(11, guid);
    add(12, LittleEndian(60000 + i, 2));
    if (i % kNullNameEvery == 0) {
      row.cells.push_back({128, std::nullopt});
    } else {
      add(128, Ascii("Item " + std::to_string(i)));
    }
    if (i % kNoBlobEvery != 0) add(129, Bytes{uint8_t(i), 0x00, 0xFF, uint8_t(i >> 8)});
    add(130, Utf16("Subject of item " + std::to_string(i)));
    if (i % 2 == 0) add(256, Utf16("Body text " + std::to_string(i)));
    if (i % 3 == 0) add(257, Bytes{0xDE, 0xAD, uint8_t(i), 0xBE, 0xEF}, kTaggedLongValue);
    row.deleted = i % kDeletedEvery == 0;
    t.rows.push_back(std::move(row));
  }
  return t;
}

TableLayout FoldersTable() {
  TableLayout t;
  t.name = "Folders";
  t.columns = {
      {1, "FolderId", kColumnLong},
      {2, "ParentId", kColumnLong},
      {128, "DisplayName", kColumnText, 255, kCodepageUtf16},
  };
  const char* names[] = {"Top of Information Store", "Inbox", "Sent Items", "Deleted Items"};
  for (uint32_t i = 0; i < 4; ++i) {
    RowLayout row;
    row.cells.push_back({1, LittleEndian(i + 1, 4)});
    row.cells.push_back({2, LittleEndian(i == 0 ? 0 : 1, 4)});
    row.cells.push_back({128, Utf16(names[i])});
    t.rows.push_back(std::move(row));
  }
  return t;
}

}  // namespace

uint32_t DefaultRevisionFor(uint32_t page_size) {
  if (page_size <= 4096) return 9;
  if (page_size <= 8192) return 12;
  return 17;
}

DatabaseLayout SampleDatabase(const SampleOptions& options) {
  DatabaseLayout layout;
  layout.page_size = options.page_size;
  layout.format_revision = options.revision;
  layout.tables.push_back(ItemsTable(options));
  layout.tables.push_back(FoldersTable());
  return layout;
}

}  // namespace tarnwell::forge
