// What the store builders' tests share: a store built into a scratch
// directory and read back through the program's ESE engine, typed access to
// the decoded values, and the checks of the columns both store families
// write alike.
#ifndef TARNWELL_TESTING_EXCHANGE_STORE_TEST_SUPPORT_H_
#define TARNWELL_TESTING_EXCHANGE_STORE_TEST_SUPPORT_H_

#include <gtest/gtest.h>

#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "base/text.h"
#include "engine/column_decoder.h"
#include "engine/edb_class.h"
#include "store/rtf_decompressor.h"
#include "testing/exchange/modern_store_builder.h"
#include "testing/exchange/store_builder.h"
#include "testing/forge_test_support.h"

namespace tarnwell::forge::exchange {

using engine::DecodedColumn;
using Kind = DecodedColumn::Kind;

struct ReadRow {
  std::map<std::string, DecodedColumn> values;
  std::map<std::string, uint8_t> flags;  // tagged flag byte, when the value has one
  std::map<std::string, Bytes> raw;      // stored bytes (a long-value id when separated)
};

struct Table {
  std::vector<std::string> columns;  // catalog order
  uint32_t lv_root = 0;
  std::vector<ReadRow> rows;  // table order
};

class Store {
 public:
  explicit Store(const LegacyStoreOptions& options) : dir_("store_forge") {
    Open(BuildLegacyStore(options, path(), &manifest_), options.version);
  }
  explicit Store(const ModernStoreOptions& options) : dir_("modern_forge") {
    Open(BuildModernStore(options, path(), &manifest_), options.version);
  }

  const StoreManifest& manifest() const { return manifest_; }
  std::string path() const { return dir_ / "store.edb"; }
  engine::EdbClass& reader() { return *reader_; }

  Table Read(const std::string& name) {
    Table t;
    const engine::TableDef* def = reader_->FindTable(name);
    EXPECT_NE(def, nullptr) << name;
    if (!def) return t;
    for (const engine::CatalogEntry& c : def->columns) t.columns.push_back(c.name);
    const engine::LongValueReader lvs = reader_->long_values();
    t.lv_root = def->long_value ? def->long_value->root_page() : 0;
    const engine::ColumnDecoder decoder(&lvs, t.lv_root);
    const int walked =
        reader_->ForEachRecord(*def, [&](const engine::RecordRef&, engine::RecordColumns& cols) {
          ReadRow row;
          for (size_t i = 0; i < def->columns.size(); ++i) {
            const std::string& column = def->columns[i].name;
            DecodedColumn d = decoder.Decode(def->columns[i], cols.at(i));
            if (d.kind == Kind::kAbsent) continue;
            row.values[column] = std::move(d);
            if (cols.at(i).has_flag_byte) row.flags[column] = cols.at(i).flag_byte;
            row.raw[column] = cols.at(i).value.ToBytes();
          }
          t.rows.push_back(std::move(row));
          return true;
        });
    EXPECT_EQ(walked, 1) << name;
    return t;
  }

 private:
  static constexpr uint32_t kCatalogPage = 4;

  void Open(const Status& built, int version) {
    EXPECT_TRUE(built.ok()) << built.ToString();
    reader_ = engine::MakeReader(version);
    EXPECT_TRUE(reader_->OpenDatabase(path(), engine::SourceDescriptor{}, version));
    EXPECT_EQ(reader_->CollectTreeRecords(kCatalogPage), 1);
    reader_->ParseCatalogRecords();
  }

  ScratchDir dir_;
  StoreManifest manifest_;
  std::unique_ptr<engine::EdbClass> reader_;
};

inline const DecodedColumn* Find(const ReadRow& row, const std::string& name) {
  auto it = row.values.find(name);
  return it == row.values.end() ? nullptr : &it->second;
}

inline std::string Text(const ReadRow& row, const std::string& name) {
  const DecodedColumn* d = Find(row, name);
  if (!d) return "";
  EXPECT_EQ(d->kind, Kind::kText) << name << ": " << d->text;
  return d->text;
}

inline Bytes Blob(const ReadRow& row, const std::string& name) {
  const DecodedColumn* d = Find(row, name);
  if (!d) return {};
  EXPECT_EQ(d->kind, Kind::kBinary) << name << ": " << d->text;
  return d->bytes;
}

inline std::string BlobText(const ReadRow& row, const std::string& name) {
  const Bytes b = Blob(row, name);
  return std::string(b.begin(), b.end());
}

// Integers, booleans and the 8 bytes of a date-time or double value.
inline uint64_t Number(const ReadRow& row, const std::string& name) {
  const DecodedColumn* d = Find(row, name);
  if (!d) return UINT64_MAX;
  switch (d->kind) {
    case Kind::kSigned:
      return uint64_t(d->i);
    case Kind::kUnsigned:
      return d->u;
    case Kind::kBool:
      return d->b ? 1 : 0;
    case Kind::kDateTime:
    case Kind::kDouble: {
      uint64_t bits;
      std::memcpy(&bits, &d->d, sizeof bits);
      return bits;
    }
    default:
      ADD_FAILURE() << name << " is not a number";
      return UINT64_MAX;
  }
}

// A time in whatever form the column has: 64-bit integers little-endian,
// 8-byte binary big-endian.
inline uint64_t Time(const ReadRow& row, const std::string& name) {
  const DecodedColumn* d = Find(row, name);
  if (!d) return 0;
  if (d->kind != Kind::kBinary) return Number(row, name);
  EXPECT_EQ(d->bytes.size(), 8u) << name;
  return d->bytes.size() == 8 ? LoadU64BE(d->bytes.data()) : 0;
}

inline uint64_t Le(const Bytes& b) { return b.size() == 8 ? LoadU64LE(b.data()) : 0; }

// The distribution-list members as the builders document them: u32 offset,
// u32 count, then 24 bytes of one-off header and three UTF-16 strings each.
inline std::vector<ListMember> Members(const Bytes& b) {
  std::vector<ListMember> out;
  if (b.size() < 8) return out;
  constexpr size_t kMemberHeader = 24;
  auto utf16z = [&](size_t* at) {
    size_t end = *at;
    while (end + 1 < b.size() && (b[end] | b[end + 1])) end += 2;
    std::string s = Utf16LEToUtf8(ByteView(b.data() + *at, end - *at));
    *at = end + 2;
    return s;
  };
  for (size_t at = LoadU32LE(b.data()); at + kMemberHeader < b.size();) {
    at += kMemberHeader;
    ListMember m;
    m.name = utf16z(&at);
    m.address_type = utf16z(&at);
    m.address = utf16z(&at);
    out.push_back(m);
  }
  return out;
}

// The list columns of a legacy content row, "Msg" row or code-3 header row.
inline void ExpectListColumns(const ReadRow& row, const ManifestItem& it) {
  EXPECT_EQ(Blob(row, "N67b0"), it.key);
  EXPECT_EQ(Text(row, "S3d") + Text(row, "Se1d"), it.subject);
  EXPECT_EQ(Text(row, "S42"), it.sender);
  EXPECT_EQ(Text(row, "S678e"), it.to);
  EXPECT_EQ(Text(row, "S1a"), it.message_class);
  EXPECT_EQ(Time(row, "T3007"), it.created);
  EXPECT_EQ(Time(row, "T3008"), it.modified);
  EXPECT_EQ(Time(row, "Te06"), it.received);
  EXPECT_EQ(Number(row, "Le07"), it.flags);
  EXPECT_EQ(Number(row, "L17"), it.importance);
  EXPECT_EQ(Number(row, "Be1b"), it.has_attachments ? 1u : 0u);
}

// The property columns of a legacy "Msg" row or code-3 "Body-x" row: bodies,
// RTF (through the program's decompressor), headers, the kind-specific
// values and the members.
inline void ExpectPropertyColumns(const ReadRow& row, const ManifestItem& it) {
  EXPECT_EQ(Text(row, "S1000"), it.body_text);
  EXPECT_EQ(BlobText(row, "N1013"), it.body_html);
  EXPECT_EQ(Text(row, "S7d"), it.headers);
  const Bytes rtf = Blob(row, "N1009");
  if (it.rtf_text.empty()) {
    EXPECT_TRUE(rtf.empty());
  } else {
    EXPECT_EQ(store::CheckRtfCrc(ByteView(rtf)), store::RtfCrcStatus::kMatch);
    const auto text = store::DecompressRtf(ByteView(rtf));
    ASSERT_TRUE(text.has_value());
    const ByteView body = text->body();
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(body.data()), body.size()), it.rtf_text);
  }
  for (const auto& [name, value] : it.strings) EXPECT_EQ(Text(row, name), value) << name;
  for (const auto& [name, value] : it.times) EXPECT_EQ(Time(row, name), value) << name;
  for (const auto& [name, value] : it.numbers) {
    EXPECT_EQ(Number(row, name), uint64_t(value)) << name;
  }
  for (const auto& [name, value] : it.doubles) {
    ASSERT_TRUE(row.values.count(name)) << name;
    EXPECT_EQ(row.values.at(name).d, value) << name;
  }
  const std::vector<ListMember> members = Members(Blob(row, "MN81a9"));
  ASSERT_EQ(members.size(), it.members.size());
  for (size_t k = 0; k < members.size(); ++k) {
    EXPECT_EQ(members[k].name, it.members[k].name);
    EXPECT_EQ(members[k].address_type, it.members[k].address_type);
    EXPECT_EQ(members[k].address, it.members[k].address);
  }
}

inline const ManifestFolder* FindFolder(const StoreManifest& m, const std::string& name) {
  for (const ManifestFolder& f : m.folders) {
    if (f.name == name) return &f;
  }
  return nullptr;
}

}  // namespace tarnwell::forge::exchange

#endif  // TARNWELL_TESTING_EXCHANGE_STORE_TEST_SUPPORT_H_
