// Modern stores from the builder read back through the program's ESE engine:
// every mailbox table, row and value the manifest promises must be there, in
// the stated order and encoding, compressed values included.
#include "testing/exchange/modern_store_builder.h"

#include <gtest/gtest.h>

#include <cstring>
#include <map>

#include "engine/column_value.h"
#include "engine/long_value.h"
#include "store/property_blob.h"
#include "store/real_property_blob.h"
#include "testing/exchange/property_blob_encoder.h"
#include "testing/exchange/real_blob_encoder.h"
#include "testing/exchange/store_test_support.h"

namespace tarnwell::forge::exchange {
namespace {

// The property blob as its layout is documented, read independently of the
// encoder and of the program's reader: name ("S3a06", "MS8002") -> value as
// text, or the number of L, B and T entries.
struct BlobValues {
  std::map<std::string, std::string> strings;
  std::map<std::string, uint64_t> numbers;
};

BlobValues ParseBlob(const Bytes& b) {
  BlobValues out;
  if (b.size() < 8 || std::memcmp(b.data(), "ProP", 4) != 0) return out;
  const size_t count = LoadU16LE(b.data() + 6);
  for (size_t i = 0; i < count && 8 + 8 * (i + 1) <= b.size(); ++i) {
    const uint8_t* e = b.data() + 8 + 8 * i;
    const uint16_t kind = LoadU16LE(e);
    const uint32_t field = LoadU32LE(e + 4);
    char id[8];
    std::snprintf(id, sizeof id, "%x", LoadU16LE(e + 2));
    if (kind == kBlobKindLong || kind == kBlobKindBool) {
      out.numbers[(kind == kBlobKindLong ? "L" : "B") + std::string(id)] = field;
      continue;
    }
    if (size_t(field) + 2 > b.size()) continue;
    const uint8_t marker = b[field];
    const size_t length = b[field + 1];
    if (kind == kBlobKindMultiString) {
      EXPECT_EQ(marker, 0xC9);
      std::string joined;
      size_t at = field + 2;
      for (size_t n = 0; n < length && at + 2 <= b.size(); ++n) {
        const size_t item = b[at + 1];
        if (n) joined += ';';
        joined.append(reinterpret_cast<const char*>(b.data() + at + 2),
                      std::min(item, b.size() - at - 2));
        at += 2 + item;
      }
      out.strings["MS" + std::string(id)] = joined;
      continue;
    }
    if (field + 2 + length > b.size()) continue;
    EXPECT_EQ(marker, 'M');
    const uint8_t* data = b.data() + field + 2;
    if (kind == kBlobKindString) {
      out.strings["S" + std::string(id)] = std::string(reinterpret_cast<const char*>(data), length);
    } else if (kind == kBlobKindTime && length == 8) {
      out.numbers["T" + std::string(id)] = LoadU64LE(data);
    }
  }
  return out;
}

struct Variant {
  const char* name;
  int version;
  bool later_2013;
};

class ModernStoreTest : public ::testing::TestWithParam<Variant> {
 protected:
  static ModernStoreOptions Options() {
    ModernStoreOptions o;
    o.version = GetParam().version;
    o.later_2013_variant = GetParam().later_2013;
    o.damage = ModernDamageOptions::All();
    o.bulk.messages = 40;
    o.bulk.seed = 7;
    return o;
  }
};

// Mailboxes and folders: every mailbox's tables exist under the names the
// manifest gives, and the folder rows sit where the manifest says.
TEST_P(ModernStoreTest, MailboxesAndFoldersMatchManifest) {
  Store store(Options());
  const StoreManifest& m = store.manifest();
  const bool v5 = GetParam().version == kExchange2013;
  if (v5) {
    EXPECT_EQ(store.reader().extended_catalog(), GetParam().later_2013);
  }

  const Table mailboxes = store.Read("Mailbox");
  ASSERT_EQ(mailboxes.rows.size(), m.mailboxes.size());
  bool saw_seven = false, saw_broken = false;
  for (const ManifestMailbox& mb : m.mailboxes) {
    const ReadRow& row = mailboxes.rows[mb.row];
    EXPECT_EQ(Text(row, v5 ? "DisplayName" : "S3001"), mb.name);
    EXPECT_EQ(v5 ? Number(row, "MailboxNumber") : Le(Blob(row, "Q6764")), mb.number);
    saw_seven |= mb.number == 7 && mb.folder_table == "Folder_7" &&
                 mb.message_table == "Message_7" && mb.attachment_table == "Attachment_7";
    if (!mb.damage.empty()) {
      saw_broken = true;
      const std::string name =
          v5 ? "Folder_" + std::to_string(mb.number) : Exchange2010TableNames(mb.number).folders;
      EXPECT_EQ(mb.folder_table, name);
      EXPECT_EQ(store.reader().FindTable(name), nullptr) << name;
      EXPECT_EQ(store.reader().FindTable(mb.message_table), nullptr);
      continue;
    }
    const Table folders = store.Read(mb.folder_table);
    size_t count = 0;
    for (const ManifestFolder& f : m.folders) {
      if (f.path.empty() || f.path.front() != mb.name) continue;
      ++count;
      ASSERT_LT(f.row, folders.rows.size());
      const ReadRow& row = folders.rows[f.row];
      EXPECT_EQ(Le(Blob(row, v5 ? "FolderId" : "Q6748")), f.id);
      EXPECT_EQ(Le(Blob(row, v5 ? "ParentFolderId" : "Q6749")), f.parent);
      EXPECT_EQ(Text(row, v5 ? "DisplayName" : "S3001"), f.name);
      EXPECT_EQ(Text(row, v5 ? "ContainerClass" : "S3613"), f.container_class);
      EXPECT_TRUE(f.visible);
    }
    EXPECT_EQ(folders.rows.size(), count);
  }
  EXPECT_EQ(saw_seven, v5);
  EXPECT_TRUE(saw_broken);
}

// Code 5: each folder lists the message rows whose "FolderId" is its id, in
// table order; every list and detail value comes back as written.
void CheckMessages2013(Store& store, bool later) {
  const StoreManifest& m = store.manifest();
  size_t compressed_inline = 0, compressed_chunks = 0, seven_bit = 0, unmapped = 0;
  for (const ManifestMailbox& mb : m.mailboxes) {
    if (!mb.damage.empty()) continue;
    const Table messages = store.Read(mb.message_table);
    const Table attachments = store.Read(mb.attachment_table);
    std::map<uint64_t, std::vector<const ReadRow*>> lists;
    for (const ReadRow& row : messages.rows) {
      const Bytes id = Blob(row, "MessageId");
      if (id.size() <= 8) {
        ++unmapped;
        continue;
      }
      lists[Le(Blob(row, "FolderId"))].push_back(&row);
      for (const char* c : {"MessageClass", "DisplayTo", "SubjectPrefix"}) {
        auto f = row.flags.find(c);
        if (f != row.flags.end() && (f->second & engine::kTaggedCompressed)) ++seven_bit;
      }
      auto nb = row.flags.find("NativeBody");
      if (nb == row.flags.end()) continue;
      if (nb->second & engine::kTaggedCompressed) ++compressed_inline;
      if (nb->second & engine::kTaggedSeparated) {
        engine::LongValue lv;
        const engine::LongValueReader lvs = store.reader().long_values();
        ASSERT_EQ(lvs.Read(messages.lv_root, ByteView(row.raw.at("NativeBody")), &lv), 0);
        EXPECT_GE(lv.chunks.size(), 3u);
        for (const engine::LongValueChunk& c : lv.chunks) compressed_chunks += c.compressed;
      }
    }
    for (const ManifestFolder& f : m.folders) {
      if (f.path.front() != mb.name) continue;
      const std::vector<const ReadRow*>& rows = lists[f.id];
      ASSERT_EQ(rows.size(), f.items.size()) << f.name;
      for (size_t i = 0; i < rows.size(); ++i) {
        const ReadRow& row = *rows[i];
        const ManifestItem& it = f.items[i];
        SCOPED_TRACE(f.name + " / " + it.subject);
        const Bytes id = Blob(row, "MessageId");
        EXPECT_EQ(Bytes(id.end() - 8, id.end()), it.key);
        EXPECT_EQ(int32_t(Number(row, "MessageDocumentId")), it.document_id);
        const BlobValues blob = ParseBlob(Blob(row, "PropertyBlob"));
        const auto text = [&](const std::string& name) {
          auto s = blob.strings.find(name);
          return s == blob.strings.end() ? std::string() : s->second;
        };
        EXPECT_EQ(Text(row, "SubjectPrefix") + text("Se1d"), it.subject);
        EXPECT_EQ(text("S42"), it.sender);
        EXPECT_EQ(text("Se03"), later ? it.cc : "");
        EXPECT_EQ(Text(row, "DisplayTo"), it.to);
        EXPECT_EQ(Text(row, "MessageClass"), it.message_class);
        EXPECT_EQ(Number(row, "DateCreated"), it.created);
        EXPECT_EQ(Number(row, "LastModificationTime"), it.modified);
        EXPECT_EQ(Number(row, "DateReceived"), it.received);
        EXPECT_EQ(Number(row, "IsRead") ? "Read" : "UnRead", it.flags_text);
        EXPECT_EQ(Number(row, "Importance"), it.importance);
        EXPECT_EQ(Number(row, "HasAttachments"), it.has_attachments ? 1u : 0u);
        EXPECT_EQ(blob.numbers.at("Le07"), it.flags);
        if (it.body_text.size() <= kBlobMaxValueBytes) {
          EXPECT_EQ(text("S1000"), it.body_text);
        }
        if (it.body_type) {
          EXPECT_EQ(Number(row, "BodyType"), it.body_type);
          EXPECT_EQ(BlobText(row, "NativeBody"), it.body_type == 3 ? it.body_html : it.body_text);
        } else {
          EXPECT_EQ(Find(row, "NativeBody"), nullptr);
        }
        for (const auto& [name, value] : it.strings) EXPECT_EQ(text(name), value) << name;
        for (const auto& [name, value] : it.times) EXPECT_EQ(blob.numbers.at(name), value);
        for (const auto& [name, value] : it.numbers) {
          EXPECT_EQ(blob.numbers.at(name), uint64_t(value)) << name;
        }
        std::vector<const ReadRow*> mine;
        for (const ReadRow& a : attachments.rows) {
          if (int32_t(Number(a, "MessageDocumentId")) == it.document_id) mine.push_back(&a);
        }
        ASSERT_EQ(mine.size(), it.attachments.size());
        for (size_t k = 0; k < mine.size(); ++k) {
          const ManifestAttachment& a = it.attachments[k];
          EXPECT_EQ(Number(*mine[k], "Inid"), Le(a.key));
          EXPECT_EQ(Text(*mine[k], "Name"), a.name);
          EXPECT_EQ(Number(*mine[k], "Size"), a.size);
          EXPECT_EQ(Sha256Hex(ByteView(Blob(*mine[k], "Content"))), a.sha256);
        }
      }
    }
  }
  EXPECT_EQ(unmapped, m.unmapped.size());
  EXPECT_EQ(unmapped, 1u);
  EXPECT_GT(compressed_inline, 0u);
  EXPECT_GE(compressed_chunks, 3u);
  EXPECT_GT(seven_bit, 0u);
}

// Code 3: a folder lists the header rows whose "Q6748" is its id, in table
// order; the detail columns are in "Body-x" under the same key.
void CheckMessages2010(Store& store) {
  const StoreManifest& m = store.manifest();
  for (const ManifestMailbox& mb : m.mailboxes) {
    if (!mb.damage.empty()) continue;
    const Table headers = store.Read(mb.header_table);
    const Table bodies = store.Read(mb.message_table);
    const Table attachments = store.Read(mb.attachment_table);
    std::map<Bytes, const ReadRow*> body_by_key;
    for (const ReadRow& row : bodies.rows) body_by_key[Blob(row, "N67b0")] = &row;
    std::map<uint64_t, std::vector<const ReadRow*>> lists;
    for (const ReadRow& row : headers.rows) lists[Le(Blob(row, "Q6748"))].push_back(&row);
    for (const ManifestFolder& f : m.folders) {
      if (f.path.front() != mb.name) continue;
      const std::vector<const ReadRow*>& rows = lists[f.id];
      ASSERT_EQ(rows.size(), f.items.size()) << f.name;
      for (size_t i = 0; i < rows.size(); ++i) {
        const ReadRow& row = *rows[i];
        const ManifestItem& it = f.items[i];
        SCOPED_TRACE(f.name + " / " + it.subject);
        ExpectListColumns(row, it);
        ASSERT_TRUE(body_by_key.count(it.key));
        ExpectPropertyColumns(*body_by_key[it.key], it);
        std::vector<const ReadRow*> mine;
        for (const ReadRow& a : attachments.rows) {
          if (Blob(a, "N67b0") == it.key) mine.push_back(&a);
        }
        ASSERT_EQ(mine.size(), it.attachments.size());
        for (size_t k = 0; k < mine.size(); ++k) {
          const ManifestAttachment& a = it.attachments[k];
          EXPECT_EQ(Blob(*mine[k], "Q674a"), a.key);
          const std::string display = Text(*mine[k], "S3001");
          EXPECT_EQ(display.empty() ? Text(*mine[k], "S3704") : display, a.name);
          EXPECT_EQ(Sha256Hex(ByteView(Blob(*mine[k], "N3701"))), a.sha256);
        }
      }
    }
  }
}

TEST_P(ModernStoreTest, MessagesAndAttachmentsMatchManifest) {
  Store store(Options());
  if (GetParam().version == kExchange2013) {
    CheckMessages2013(store, GetParam().later_2013);
  } else {
    CheckMessages2010(store);
  }
  uint64_t listed = 0;
  for (const ManifestFolder& f : store.manifest().folders) listed += f.items.size();
  EXPECT_EQ(listed, store.manifest().messages);
  EXPECT_GT(listed, 40u);
}

// The same options give the same bytes, and an ESE reader written without
// any of our code opens the file and lists the per-mailbox tables.
TEST_P(ModernStoreTest, SameBytesEveryTimeAndEsedbinfoListsTheTables) {
  Store a(Options()), b(Options());
  EXPECT_TRUE(ReadFileText(a.path()) == ReadFileText(b.path()));
  EXPECT_EQ(ManifestJson(a.manifest()), ManifestJson(b.manifest()));
  if (!HaveTool("esedbinfo")) GTEST_SKIP() << "esedbinfo (Debian libesedb-utils) not installed";
  const std::string log = a.path() + ".info";
  ASSERT_EQ(RunTool("esedbinfo '" + a.path() + "'", log), 0) << ReadFileText(log);
  const std::string info = ReadFileText(log);
  for (const ManifestMailbox& mb : a.manifest().mailboxes) {
    if (mb.damage.empty()) {
      EXPECT_NE(info.find("\t" + mb.message_table + " ("), std::string::npos) << info;
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Versions, ModernStoreTest,
                         ::testing::Values(Variant{"Exchange2010", kExchange2010, false},
                                           Variant{"Exchange2013", kExchange2013, false},
                                           Variant{"Exchange2013Later", kExchange2013, true}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(Exchange2010TableNamesTest, CutsTheHexNumberAtRunsOfZeros) {
  const struct {
    uint64_t number;
    const char* folders;
    const char* header;
  } kCases[] = {
      {0x2000000003Aull, "Folders-2-3A", "MsgHeader-2-3A"},
      {0x123456789Aull, "Folders--23456789A", "MsgHeader--23456789A"},
      {0xab0000cd0000efull, "Folders-ab-EF", "MsgHeader-AB-EF"},
      {0x30000000000C1ull, "Folders-3-C1", "MsgHeader-3-C1"},
  };
  for (const auto& c : kCases) {
    const Modern2010Tables names = Exchange2010TableNames(c.number);
    EXPECT_EQ(names.folders, c.folders);
    EXPECT_EQ(names.header, c.header);
    EXPECT_EQ(names.body, "Body" + names.folders.substr(7));
  }
}

TEST(PropertyBlobEncoderTest, RefusesValuesALengthByteCannotSay) {
  PropertyBlobEncoder blob;
  EXPECT_TRUE(blob.AddString(0x0E1D, std::string(kBlobMaxValueBytes, 'x')));
  EXPECT_FALSE(blob.AddString(0x0E1D, std::string(kBlobMaxValueBytes + 1, 'x')));
  EXPECT_FALSE(blob.AddNamedNumber("I3a4d", 1));
  EXPECT_FALSE(blob.AddNamedNumber("D8121", 1));
  EXPECT_TRUE(blob.AddNamedNumber("B8124", 1));
  EXPECT_EQ(blob.entries(), 2u);
  const BlobValues v = ParseBlob(blob.Finish());
  EXPECT_EQ(v.strings.at("Se1d"), std::string(kBlobMaxValueBytes, 'x'));
  EXPECT_EQ(v.numbers.at("B8124"), 1u);
}

// The server layout: revision 110 with 8-byte long-value ids, every blob of
// the 3-byte-entry layout read whole, far values in their separated columns,
// and libesedb accepting the file.
TEST(RealLayoutStoreTest, RowsBlobsAndLongValuesAsServersWriteThem) {
  ModernStoreOptions o;
  o.real_layout = true;
  Store store(o);
  EXPECT_EQ(store.reader().header().format_revision, 110u);
  size_t blobs = 0, far_values = 0, wide_ids = 0;
  for (const ManifestMailbox& mb : store.manifest().mailboxes) {
    for (const std::string& name : {mb.folder_table, mb.message_table, mb.attachment_table}) {
      for (const ReadRow& row : store.Read(name).rows) {
        for (const char* column : {"PropertyBlob", "OffPagePropertyBlob"}) {
          const Bytes b = Blob(row, column);
          if (b.empty()) continue;
          const store::RealBlob parsed = store::ParseRealBlob(b);
          EXPECT_TRUE(parsed.complete) << name << " " << column << ": " << parsed.problem;
          ++blobs;
          for (store::BlobEntry e : parsed.entries) {
            if (e.state != store::BlobValueState::kFarValue) continue;
            ++far_values;
            EXPECT_TRUE(
                store::ResolveFarValue(Blob(row, store::SeparatedPropertyColumn(e.far_slot)), &e))
                << e.name;
          }
        }
        for (const auto& [column, flag] : row.flags) {
          // A separated value's record holds its 8-byte long-value id.
          if (flag & engine::kTaggedSeparated) {
            wide_ids += row.raw.at(column).size() == engine::kLongValueId64Size;
          }
        }
      }
    }
    EXPECT_NE(store.reader().FindTable("ExtendedPropertyNameMapping_" + std::to_string(mb.number)),
              nullptr);
  }
  EXPECT_GT(blobs, 50u);
  EXPECT_GT(far_values, 0u);
  EXPECT_GT(wide_ids, 0u);
  if (HaveTool("esedbinfo")) {
    EXPECT_EQ(RunTool("esedbinfo '" + store.path() + "'", store.path() + ".info"), 0);
  }
}

// Values land inline, near or far by their size, and read back as written.
TEST(RealBlobEncoderTest, PlacesValuesByTheirSize) {
  struct Case {
    size_t chars;
    bool near;
    bool far;
  };
  for (const Case& c : {Case{10, false, false}, Case{300, true, false}, Case{3000, false, true}}) {
    SCOPED_TRACE(c.chars);
    RealBlobEncoder e;
    e.AddInt32(1, -70000);
    e.AddString(0x1000, std::string(c.chars, 'x'));
    e.AddMultiString(0x8002, {"a", "Grün"});
    std::vector<SeparatedValue> separated;
    const Bytes blob = e.Finish(&separated);
    EXPECT_EQ(blob[4], c.near ? 0x01 : 0x00);
    EXPECT_EQ(separated.size(), c.far ? 1u : 0u);
    const store::RealBlob parsed = store::ParseRealBlob(blob);
    ASSERT_TRUE(parsed.complete) << parsed.problem;
    ASSERT_EQ(parsed.entries.size(), 3u);
    EXPECT_EQ(LoadU32LE(parsed.entries[0].value.data()), uint32_t(-70000));
    store::BlobEntry body = parsed.entries[1];
    if (c.far) {
      ASSERT_TRUE(store::ResolveFarValue(separated[0].encoded, &body));
    }
    EXPECT_EQ(body.value.size(), c.chars);
    EXPECT_EQ(std::string(parsed.entries[2].value.begin(), parsed.entries[2].value.end()),
              "a;Grün");
  }
}

}  // namespace
}  // namespace tarnwell::forge::exchange
