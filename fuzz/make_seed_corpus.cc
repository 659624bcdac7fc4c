// Writes the fuzzers' seed corpus, one folder per target, from databases the
// test writer builds:
//
//   make_seed_corpus OUT_DIR
//
//   folder     seeds
//   database   small databases of each page size and revision, opened by
//              header and as their Exchange version, and a few with junk in
//              front or their header blocks missing
//   page       every written page of those databases
//   record     records of the fuzz column table in each tagged-value form
//   catalog    the catalog records of each database
//   compress   Xpress streams, and 7-bit, Xpress and LZ4 column values
//
// Output is deterministic; nothing here is committed.
#include <sys/stat.h>

#include <cstdio>
#include <cstring>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "engine/catalog.h"
#include "engine/edb_class.h"
#include "fuzz/fuzz_columns.h"
#include "fuzz/memfd_database.h"
#include "mapi/property_tags.h"
#include "mapi/pst/pst_store.h"
#include "testing/encoders/lz4_value_encoder.h"
#include "testing/encoders/seven_bit_encoder.h"
#include "testing/encoders/xpress_encoder.h"
#include "testing/ese_writer.h"
#include "testing/forge_record.h"
#include "testing/forge_sample.h"

namespace {

using namespace tarnwell;

// Input-format constants of the fuzzers (see each *_fuzzer.cc).
constexpr uint32_t kFuzzPageSizes[] = {4096, 8192, 32768};
constexpr uint8_t kFormSmall = 0, kFormLarge = 1, kFormInline = 2;
constexpr uint8_t kModeInspect = 0;
constexpr uint32_t kSeedRows = 24;
constexpr uint32_t kRowsPerLeaf = 3;
constexpr uint32_t kChildrenPerBranch = 3;
constexpr size_t kJunkPrefix = 1000;
constexpr uint32_t kLegacyRevision = 2;
constexpr uint32_t kRevision2013 = 20;

class Corpus {
 public:
  explicit Corpus(std::string root) : root_(std::move(root)) {}

  bool Put(const std::string& folder, const std::string& name, const Bytes& bytes) {
    const std::string dir = root_ + "/" + folder;
    mkdir(root_.c_str(), 0755);
    mkdir(dir.c_str(), 0755);
    const std::string path = dir + "/" + name;
    std::FILE* f = std::fopen(path.c_str(), "wb");
    if (!f) return Fail("cannot create " + path);
    const bool ok = std::fwrite(bytes.data(), 1, bytes.size(), f) == bytes.size();
    if (std::fclose(f) != 0 || !ok) return Fail("cannot write " + path);
    ++written_;
    return true;
  }
  bool Fail(const std::string& why) {
    std::fprintf(stderr, "make_seed_corpus: %s\n", why.c_str());
    failed_ = true;
    return false;
  }
  bool failed() const { return failed_; }
  const std::string& root() const { return root_; }
  size_t written() const { return written_; }

 private:
  std::string root_;
  size_t written_ = 0;
  bool failed_ = false;
};

Bytes WithTrailer(Bytes bytes, uint8_t trailer) {
  bytes.push_back(trailer);
  return bytes;
}

uint8_t PageSizeIndex(uint32_t page_size) {
  for (uint8_t i = 0; i < std::size(kFuzzPageSizes); ++i) {
    if (kFuzzPageSizes[i] == page_size) return i;
  }
  return 0;
}

// Catalog records as the catalog fuzzer takes them: u16 length, bytes.
Bytes CatalogRecords(const Bytes& database) {
  fuzz::MemfdDatabase file;
  const std::string& path = file.Write(database.data(), database.size());
  std::unique_ptr<engine::EdbClass> reader;
  Bytes out;
  if (!engine::InspectDatabase(path, &reader).ok()) return out;
  reader->CollectTreeRecords(engine::kCatalogRootPage);
  for (const engine::RecordRef& ref : reader->records()) {
    const engine::NodeCopy node = reader->ReadNode(ref.page_number, ref.tag_index);
    if (ref.data_offset > node.data.size()) continue;
    const size_t n = node.data.size() - ref.data_offset;
    out.push_back(uint8_t(n));
    out.push_back(uint8_t(n >> 8));
    out.insert(out.end(), node.data.begin() + ref.data_offset, node.data.end());
  }
  return out;
}

struct DatabaseSeed {
  const char* name;
  uint32_t page_size;
  uint32_t revision;
  uint8_t version;  // Exchange version code it opens as
};

constexpr DatabaseSeed kDatabases[] = {
    {"e2000_4k", 4096, 9, engine::kExchange2000},
    {"e55_4k", 4096, kLegacyRevision, engine::kExchange55},
    {"e2007_8k", 8192, 12, engine::kExchange2007},
    {"e2010_32k", 32768, 17, engine::kExchange2010},
    {"e2013_32k", 32768, kRevision2013, engine::kExchange2013},
};

void WriteDatabases(Corpus* corpus) {
  for (const DatabaseSeed& seed : kDatabases) {
    forge::SampleOptions options;
    options.page_size = seed.page_size;
    options.revision = seed.revision;
    options.rows = kSeedRows;
    options.max_rows_per_leaf = kRowsPerLeaf;
    options.max_children_per_branch = kChildrenPerBranch;
    const forge::DatabaseLayout layout = forge::SampleDatabase(options);
    forge::Manifest manifest;
    Status s;
    const Bytes db = forge::BuildDatabase(layout, &manifest, {}, &s);
    if (!s.ok()) {
      corpus->Fail(std::string(seed.name) + ": " + s.message());
      continue;
    }
    const std::string base = seed.name;
    corpus->Put("database", base + "_inspect", WithTrailer(db, kModeInspect));
    corpus->Put("database", base + "_exchange", WithTrailer(db, seed.version));
    forge::FileDamage junk;
    junk.junk_prefix = kJunkPrefix;
    corpus->Put("database", base + "_junk",
                WithTrailer(forge::BuildDatabase(layout, nullptr, junk), seed.version));
    forge::FileDamage headless;
    headless.drop_header_pages = true;
    corpus->Put("database", base + "_headless",
                WithTrailer(forge::BuildDatabase(layout, nullptr, headless), seed.version));

    corpus->Put("catalog", base, CatalogRecords(db));

    const uint8_t size_index = PageSizeIndex(seed.page_size);
    for (uint32_t number : manifest.written_pages) {
      const size_t at = size_t(number + 1) * seed.page_size;
      if (at + seed.page_size > db.size()) continue;
      Bytes page{size_index};
      page.insert(page.end(), db.begin() + at, db.begin() + at + seed.page_size);
      corpus->Put("page", base + "_page" + std::to_string(number), page);
    }
  }
}

std::vector<forge::ColumnLayout> FuzzColumnSpecs() {
  std::vector<forge::ColumnLayout> columns;
  for (const fuzz::FuzzColumn& c : fuzz::kFuzzColumns) {
    forge::ColumnLayout layout;
    layout.id = c.id;
    layout.name = c.name;
    layout.type = c.type;
    layout.size = c.size;
    layout.codepage = c.code_page;
    columns.push_back(layout);
  }
  return columns;
}

// Rows that between them use every way a value can be stored.
std::vector<std::vector<forge::Cell>> SeedRows(bool large) {
  using forge::Cell;
  const uint8_t plain = large ? forge::kTaggedLongValue : 0;
  Bytes guid(16);
  for (size_t i = 0; i < guid.size(); ++i) guid[i] = uint8_t(i * 17);
  const std::string text = "Tarnwell seed text, Tarnwell seed text, Tarnwell seed text";
  std::vector<std::vector<Cell>> rows;
  rows.push_back({
      {1, forge::LittleEndian(0xFF, 1)},
      {2, forge::LittleEndian(7, 1)},
      {3, forge::LittleEndian(0xFFFE, 2)},
      {4, forge::LittleEndian(123456, 4)},
      {5, forge::LittleEndian(99999, 8)},
      {6, forge::LittleEndian(0x3FC00000, 4)},
      {7, forge::LittleEndian(0x400921FB54442D18ull, 8)},
      {8, forge::LittleEndian(0x40E5000000000000ull, 8)},
      {9, forge::LittleEndian(0xFFFF0001u, 4)},
      {10, forge::LittleEndian(0x8000000000000001ull, 8)},
      {11, guid},
      {12, forge::LittleEndian(65000, 2)},
      {128, forge::Ascii("Name")},
      {129, Bytes{0, 1, 2, 3}},
      {130, forge::Utf16("Subject")},
      {256, forge::Utf16("Body"), plain},
      {257, Bytes{0xDE, 0xAD, 0xBE, 0xEF}, plain},
      {258, forge::Ascii(text), plain},
      {259, forge::LittleEndian(42, 4), plain},
      {260, forge::LittleEndian(0x40E5000000000000ull, 8), plain},
      {263, guid, plain},
  });
  rows.push_back({
      {3, std::nullopt},
      {11, guid},
      {128, std::nullopt},
      {130, forge::Utf16("")},
      {256, forge::EncodeSevenBitUnicode(u"seven-bit unicode body"), forge::kTaggedCompressed},
      {257, forge::EncodeEseXpressValue(ByteView(forge::Ascii(text + text))),
       forge::kTaggedCompressed},
      {258, forge::EncodeSevenBitAscii("seven-bit ascii"), forge::kTaggedCompressed},
  });
  rows.push_back({
      {256, forge::EncodeEseLz4Value(ByteView(forge::Utf16(text))), forge::kTaggedCompressed},
      {257, forge::LittleEndian(0x1234, 4), forge::kTaggedSeparated},
      {259,
       forge::EncodeMultiValue(
           {forge::LittleEndian(1, 4), forge::LittleEndian(2, 4), forge::LittleEndian(3, 4)}),
       forge::kTaggedMultiValued},
      {260, std::nullopt},
  });
  Bytes two{4};
  const Bytes second = forge::LittleEndian(0xABCDEF, 4);
  Bytes first = forge::LittleEndian(0x123456, 4);
  two.insert(two.end(), first.begin(), first.end());
  two.insert(two.end(), second.begin(), second.end());
  rows.push_back({{1, forge::LittleEndian(0, 1)}, {259, two, forge::kTaggedTwoValues}});
  rows.push_back({});
  return rows;
}

void WriteRecords(Corpus* corpus) {
  const std::vector<forge::ColumnLayout> columns = FuzzColumnSpecs();
  const struct {
    forge::TaggedLayout layout;
    uint8_t form;
    const char* name;
  } kLayouts[] = {
      {forge::TaggedLayout::kSmallPages, kFormSmall, "small"},
      {forge::TaggedLayout::kLargePages, kFormLarge, "large"},
      {forge::TaggedLayout::kLinear, kFormInline, "inline"},
  };
  for (const auto& l : kLayouts) {
    const auto rows = SeedRows(l.layout == forge::TaggedLayout::kLargePages);
    for (size_t i = 0; i < rows.size(); ++i) {
      Bytes record;
      Status s = forge::EncodeRecord(columns, rows[i], l.layout, &record);
      if (!s.ok()) {
        corpus->Fail(std::string("record ") + l.name + ": " + s.message());
        continue;
      }
      Bytes seed{l.form};
      seed.insert(seed.end(), record.begin(), record.end());
      corpus->Put("record", std::string(l.name) + "_" + std::to_string(i), seed);
    }
  }
}

void WriteCompressed(Corpus* corpus) {
  const std::string text =
      "From: someone\r\nSubject: seed\r\n\r\nabcabcabcabcabcabcabc 0123456789 abcabcabcabc";
  const Bytes plain = forge::Ascii(text);
  auto seed = [](size_t cap, uint8_t format, const Bytes& payload) {
    Bytes s{uint8_t(cap), uint8_t(cap >> 8), format};
    s.insert(s.end(), payload.begin(), payload.end());
    return s;
  };
  const uint8_t kXpressFormat = 3;
  corpus->Put("compress", "xpress_stream",
              seed(plain.size(), kXpressFormat, forge::XpressCompress(ByteView(plain))));
  corpus->Put("compress", "xpress_value",
              seed(plain.size(), 0, forge::EncodeEseXpressValue(ByteView(plain))));
  Bytes zeros(300, 0);
  corpus->Put("compress", "xpress_long_match",
              seed(zeros.size(), kXpressFormat, forge::XpressCompress(ByteView(zeros))));
  corpus->Put("compress", "seven_bit_ascii", seed(0, 1, forge::EncodeSevenBitAscii(text)));
  corpus->Put("compress", "seven_bit_unicode",
              seed(0, 2, forge::EncodeSevenBitUnicode(u"seven-bit unicode")));
  corpus->Put("compress", "lz4_value", seed(0, 7, forge::EncodeEseLz4Value(ByteView(plain))));
}

// Composed messages for the MIME parser, and property blobs of both layouts.
void WriteMessagesAndBlobs(Corpus* corpus) {
  corpus->Put("mime", "plain",
              forge::Ascii("From: a@example.com\r\nSubject: =?utf-8?B?w6TDtsO8?=\r\n\r\nbody\r\n"));
  corpus->Put("mime", "mixed",
              forge::Ascii("Content-Type: multipart/mixed; boundary=\"b\"\r\n\r\n--b\r\n"
                           "Content-Transfer-Encoding: quoted-printable\r\n\r\nGr=C3=BC=C3=9Fe\r\n"
                           "--b\r\nContent-Type: application/octet-stream; name=\"x.bin\"\r\n"
                           "Content-Transfer-Encoding: base64\r\n\r\nAAECAwQ=\r\n--b--\r\n"));
  // Documented layout: "ProP", u16, count 2, {kind, id, offset}; 'M' values.
  Bytes documented = forge::Ascii("ProP");
  const uint8_t entries[] = {0, 0, 2,    0,    0x48, 0x48, 0x42, 0x00, 24, 0,
                             0, 0, 0x18, 0x18, 0x07, 0x0E, 1,    0,    0,  0};
  documented.insert(documented.end(), std::begin(entries), std::end(entries));
  const uint8_t value[] = {'M', 3, 'a', 'b', 'c'};
  documented.insert(documented.end(), std::begin(value), std::end(value));
  corpus->Put("blob", "documented", documented);
  // Real layout: "ProP", flags 0x0400, count 2, 3-byte entries, values.
  Bytes real = forge::Ascii("ProP");
  const uint8_t real_tail[] = {0x00, 0x04, 2,    0, 0x48, 0x1D, 0x0E, 0x18,
                               0x36, 0x00, 0x4D, 2, 'h',  'i',  0x19, 0x05};
  real.insert(real.end(), std::begin(real_tail), std::end(real_tail));
  corpus->Put("blob", "real", real);
}

// A small PST with a folder and a message with a recipient and an
// attachment, and the composed files the importers read.
void WritePstAndImports(Corpus* corpus) {
  const std::string path = corpus->root() + "/seed.pst.tmp";
  std::remove(path.c_str());
  {
    std::unique_ptr<mapi::pst::PstStore> store;
    if (!mapi::pst::PstStore::Create(path, "Seeds", &store).ok()) {
      corpus->Fail("cannot write a PST seed");
      return;
    }
    mapi::pst::Nid folder = 0, message = 0;
    uint64_t size = 0;
    store->AddFolder(store->top_folder(), "Inbox", "", &folder);
    mapi::Message m;
    m.properties.Set(mapi::kPidMessageClass, mapi::PropertyValue::Unicode("IPM.Note"));
    m.properties.Set(mapi::kPidSubject, mapi::PropertyValue::Unicode("seed"));
    mapi::PropertyBag to;
    to.Set(mapi::kPidRecipientType, mapi::PropertyValue::Int32(mapi::kRecipientTo));
    to.Set(mapi::kPidDisplayName, mapi::PropertyValue::Unicode("a@example.com"));
    m.recipients.push_back(to);
    mapi::Attachment a;
    a.properties.Set(mapi::kPidAttachMethod, mapi::PropertyValue::Int32(mapi::kAttachByValue));
    a.data = forge::Ascii("attachment");
    m.attachments.push_back(std::move(a));
    store->AddMessage(folder, m, &message, &size);
    store->Commit();
  }
  std::FILE* f = std::fopen(path.c_str(), "rb");
  Bytes bytes;
  if (f) {
    int c;
    while ((c = std::fgetc(f)) != EOF) bytes.push_back(uint8_t(c));
    std::fclose(f);
  }
  std::remove(path.c_str());
  corpus->Put("pst", "small", bytes);
  corpus->Put("import", "vcard",
              forge::Ascii("BEGIN:VCARD\r\nVERSION:2.1\r\nN:Doe;John\r\nFN:John Doe\r\n"
                           "EMAIL;INTERNET:j@example.com\r\nEND:VCARD\r\n"));
  corpus->Put("import", "ical",
              forge::Ascii("BEGIN:VCALENDAR\r\nVERSION:2.0\r\nBEGIN:VEVENT\r\n"
                           "DTSTART:20210101T100000Z\r\nDTEND:20210101T110000Z\r\n"
                           "SUMMARY:Meeting\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n"));
  corpus->Put("import", "mail",
              forge::Ascii("From: a@example.com\r\nTo: \"B, C\" <b@example.com>\r\n"
                           "Subject: s\r\nContent-Type: text/plain\r\n\r\nbody\r\n"));
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fputs("usage: make_seed_corpus OUT_DIR\n", stderr);
    return 2;
  }
  Corpus corpus(argv[1]);
  WriteDatabases(&corpus);
  WriteRecords(&corpus);
  WriteCompressed(&corpus);
  WriteMessagesAndBlobs(&corpus);
  WritePstAndImports(&corpus);
  std::printf("make_seed_corpus: %zu seeds in %s\n", corpus.written(), argv[1]);
  return corpus.failed() ? 1 : 0;
}
