// What the PST tests share: deterministic data, scratch folders, a file held
// in memory, messages to write, and running the other PST readers and
// comparing what they exported with what we wrote or read.
#ifndef TARNWELL_MAPI_PST_PST_TEST_SUPPORT_H_
#define TARNWELL_MAPI_PST_PST_TEST_SUPPORT_H_

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "base/paths.h"
#include "mapi/property_tags.h"
#include "mapi/pst/allocation_map.h"
#include "mapi/pst/block_io.h"
#include "mapi/pst/btree_page.h"
#include "mapi/pst/node.h"
#include "mapi/pst/pst_store.h"

namespace tarnwell::mapi::pst {

inline Bytes Pattern(size_t n, uint32_t seed) {
  Bytes b(n);
  for (uint8_t& byte : b) {
    seed = seed * 1103515245u + 12345u;
    byte = uint8_t(seed >> 16);
  }
  return b;
}

inline std::string ReadText(const std::filesystem::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

inline Bytes ReadBytes(const std::filesystem::path& path) {
  std::string s = ReadText(path);
  return Bytes(s.begin(), s.end());
}

// A fresh folder, removed when the test program ends.
inline std::string TempDir(const std::string& name) {
  struct Made {
    ~Made() {
      std::error_code ignored;
      for (const std::string& d : dirs) std::filesystem::remove_all(d, ignored);
    }
    std::vector<std::string> dirs;
  };
  static Made made;
  std::string dir;
  EXPECT_TRUE(MakeTempDir("pst_test_" + name, &dir).ok());
  made.dirs.push_back(dir);
  return dir;
}

// Node contents compared block by block, subnodes included.
inline void ExpectSameContent(const NodeContent& got, const NodeContent& want,
                              const std::string& where) {
  EXPECT_EQ(got.blocks, want.blocks) << where;
  ASSERT_EQ(got.subnodes.size(), want.subnodes.size()) << where;
  for (auto g = got.subnodes.begin(), w = want.subnodes.begin(); g != got.subnodes.end();
       ++g, ++w) {
    EXPECT_EQ(g->first, w->first) << where;
    ExpectSameContent(g->second, w->second, where + "/" + std::to_string(g->first));
  }
}

// A file in memory: blocks are appended at the end, 64-byte aligned, and
// indexed in a map instead of a block B-tree.
class MemoryStore : public BlockStore, public PageIo {
 public:
  explicit MemoryStore(CryptMethod crypt = CryptMethod::kNone) : crypt_(crypt) {
    data_.resize(kFirstAMapOffset);
  }
  CryptMethod crypt_method() const override { return crypt_; }
  uint64_t file_size() const override { return data_.size(); }
  Status FindBlock(uint64_t bid, BlockRef* out) const override {
    auto it = index_.find(bid & ~kBidReservedBit);
    if (it == index_.end()) return Status::Corruption("missing block");
    *out = it->second;
    return Status::Ok();
  }
  Status ReadAt(uint64_t ib, size_t size, uint8_t* out) const override {
    if (ib + size > data_.size()) return Status::Corruption("past end");
    std::memcpy(out, data_.data() + ib, size);
    return Status::Ok();
  }
  uint64_t NewBid(bool internal) override {
    next_bid_ += kBidIncrement;
    return internal ? next_bid_ | kBidInternalFlag : next_bid_;
  }
  Status AppendBlock(uint64_t bid, ByteView data) override {
    uint64_t ib = data_.size();
    Bytes b = EncodeBlock(data, bid, ib);
    data_.insert(data_.end(), b.begin(), b.end());
    index_[bid] = {ib, uint16_t(data.size())};
    return Status::Ok();
  }
  Status AllocatePage(uint64_t* ib, uint64_t* bid) override {
    data_.resize((data_.size() + kPageSize - 1) / kPageSize * kPageSize + kPageSize);
    *ib = data_.size() - kPageSize;
    *bid = ++next_page_;
    return Status::Ok();
  }
  Status WriteAt(uint64_t ib, ByteView d) override {
    if (ib + d.size() > data_.size()) data_.resize(ib + d.size());
    std::memcpy(data_.data() + ib, d.data(), d.size());
    return Status::Ok();
  }

  Bytes& data() { return data_; }
  std::map<uint64_t, BlockRef>& index() { return index_; }
  ReadBudget Budget() const { return {index_.size() + 16, data_.size()}; }

 private:
  CryptMethod crypt_;
  Bytes data_;
  std::map<uint64_t, BlockRef> index_;
  uint64_t next_bid_ = 0;
  uint64_t next_page_ = 0;
};

// ---- Running the other programs

inline bool HaveTool(const std::string& name) {
  return std::system(("command -v " + name + " >/dev/null 2>&1").c_str()) == 0;
}

inline std::string Quote(const std::string& s) {
  std::string out = "'";
  for (char c : s) out += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return out + "'";
}

// Runs a shell command; its exit status, with stdout and stderr in *output.
inline int RunCommand(const std::string& command, std::string* output) {
  FILE* pipe = popen((command + " 2>&1").c_str(), "r");
  if (pipe == nullptr) return -1;
  char buffer[4096];
  size_t n;
  output->clear();
  while ((n = fread(buffer, 1, sizeof buffer, pipe)) > 0) output->append(buffer, n);
  int status = pclose(pipe);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// The value after "Key:" and tabs in a pffexport item description.
inline std::string Field(const std::string& text, const std::string& key) {
  std::regex re("(^|\\n)" + key + ":\\t+([^\\n]*)");
  std::smatch m;
  if (!std::regex_search(text, m, re)) return "";
  return m[2].str();
}

// ---- What pffexport wrote

struct ExportedItem {
  std::string kind;         // "Message", "Contact", "Appointment", ...
  std::string description;  // the item's <kind>.txt, or a mail's OutlookHeaders.txt
  std::vector<std::map<std::string, std::string>> recipients;
  std::map<std::string, Bytes> files;                      // the item's own files (bodies)
  std::vector<std::pair<std::string, Bytes>> attachments;  // data attachments
  std::vector<ExportedItem> embedded;
};

struct ExportedFolder {
  std::map<std::string, ExportedFolder> folders;
  std::vector<ExportedItem> items;        // in pffexport's numbering order
  std::set<std::string> skipped_classes;  // the root's: classes pffexport does not export
  std::string log;                        // the root's: pffexport's log file
};

// An item directory is <Kind><5 digits> holding <Kind>.txt (mail: also
// OutlookHeaders.txt, as the body may take Message.txt).
inline bool IsItemDir(const std::filesystem::path& dir, std::string* kind) {
  static const std::regex re("([A-Za-z]+)[0-9]{5}");
  std::smatch m;
  std::string name = dir.filename().string();
  if (!std::regex_match(name, m, re)) return false;
  *kind = m[1].str();
  return std::filesystem::exists(dir / (*kind + ".txt")) ||
         std::filesystem::exists(dir / "OutlookHeaders.txt");
}

inline ExportedItem ParseItem(const std::filesystem::path& dir, const std::string& kind) {
  namespace fs = std::filesystem;
  ExportedItem item;
  item.kind = kind;
  item.description = fs::exists(dir / "OutlookHeaders.txt") ? ReadText(dir / "OutlookHeaders.txt")
                                                            : ReadText(dir / (kind + ".txt"));
  std::map<std::string, std::string> current;
  std::istringstream lines(ReadText(dir / "Recipients.txt"));
  std::string line;
  while (std::getline(lines, line)) {
    size_t colon = line.find(':');
    if (line.empty() || colon == std::string::npos) {
      if (!current.empty()) item.recipients.push_back(current);
      current.clear();
      continue;
    }
    size_t value = line.find_first_not_of('\t', colon + 1);
    current[line.substr(0, colon)] = value == std::string::npos ? "" : line.substr(value);
  }
  if (!current.empty()) item.recipients.push_back(current);
  for (const auto& e : fs::directory_iterator(dir)) {
    if (e.is_regular_file()) item.files[e.path().filename().string()] = ReadBytes(e.path());
  }
  if (!fs::is_directory(dir / "Attachments")) return item;
  std::set<fs::path> attachments;
  for (const auto& e : fs::directory_iterator(dir / "Attachments")) attachments.insert(e.path());
  for (const fs::path& p : attachments) {
    if (fs::is_regular_file(p)) {
      item.attachments.push_back({p.filename().string(), ReadBytes(p)});
      continue;
    }
    for (const auto& inner : fs::directory_iterator(p)) {
      std::string inner_kind;
      if (IsItemDir(inner.path(), &inner_kind)) {
        item.embedded.push_back(ParseItem(inner.path(), inner_kind));
      }
    }
  }
  return item;
}

inline void ParseFolder(const std::filesystem::path& dir, ExportedFolder* out, int depth = 0) {
  if (depth > 30) return;
  std::map<std::string, std::filesystem::path> items;  // by number: pffexport's order
  for (const auto& e : std::filesystem::directory_iterator(dir)) {
    if (!e.is_directory()) continue;
    std::string kind;
    std::string name = e.path().filename().string();
    if (IsItemDir(e.path(), &kind)) {
      items[name.substr(kind.size())] = e.path();
    } else {
      ParseFolder(e.path(), &out->folders[name], depth + 1);
    }
  }
  for (const auto& [number, path] : items) {
    std::string kind;
    IsItemDir(path, &kind);
    out->items.push_back(ParseItem(path, kind));
  }
}

// Runs pffexport on `pst` in `work`; false (with its output in *output) when
// it fails. pffexport leaves out items of classes it does not know; their
// classes go to root->skipped_classes.
inline bool PffExport(const std::string& pst, const std::string& work, ExportedFolder* root,
                      std::string* output) {
  std::string target = work + "/pff";
  std::filesystem::remove_all(target + ".export");
  std::filesystem::remove(work + "/pff.log");
  if (RunCommand("pffexport -q -m items -f all -l " + Quote(work + "/pff.log") + " -t " +
                     Quote(target) + " " + Quote(pst),
                 output) != 0) {
    return false;
  }
  ParseFolder(target + ".export", root);
  root->log = ReadText(work + "/pff.log");
  static const std::regex re(
      "Skipped export of item: [0-9]+ out of: [0-9]+ of type: ([^\\n]*) \\(");
  for (std::sregex_iterator it(root->log.begin(), root->log.end(), re), end; it != end; ++it) {
    root->skipped_classes.insert((*it)[1].str());
  }
  return true;
}

// ---- Messages

inline constexpr uint64_t kJan2024 = 133485408000000000ull;  // 2024-01-01 00:00 UTC as FILETIME

inline PropertyValue U(const std::string& text) { return PropertyValue::Unicode(text); }
inline PropertyValue Time(uint64_t filetime) { return PropertyValue::SysTime(filetime); }

// A message of class `cls` with these properties.
inline Message NewMessage(const std::string& cls, const std::string& subject,
                          const std::vector<std::pair<uint16_t, PropertyValue>>& tagged,
                          const std::vector<std::pair<NamedProperty, PropertyValue>>& named = {}) {
  Message m;
  m.properties.Set(kPidMessageClass, U(cls));
  m.properties.Set(kPidSubject, U(subject));
  for (const auto& [id, value] : tagged) m.properties.Set(id, value);
  for (const auto& [name, value] : named) m.properties.SetNamed(name, value);
  return m;
}

inline PropertyBag Recipient(int32_t type, const std::string& name, const std::string& address) {
  PropertyBag r;
  r.Set(kPidRecipientType, PropertyValue::Int32(type));
  r.Set(kPidDisplayName, U(name));
  r.Set(kPidAddressType, U("SMTP"));
  r.Set(kPidEmailAddress, U(address));
  r.Set(kPidSmtpAddress, U(address));
  return r;
}

inline Message Mail(const std::string& subject, const std::string& body) {
  return NewMessage("IPM.Note", subject,
                    {{kPidConversationTopic, U(subject)},
                     {kPidBody, U(body)},
                     {kPidClientSubmitTime, Time(kJan2024)},
                     {kPidMessageDeliveryTime, Time(kJan2024 + 600'000'000)},
                     {kPidImportance, PropertyValue::Int32(1)},
                     {kPidSenderName, U("Alice Sender")},
                     {kPidSentRepresentingName, U("Alice Sender")},
                     {kPidSenderEmailAddress, U("alice@example.com")},
                     {kPidSentRepresentingEmailAddress, U("alice@example.com")},
                     {kPidSenderAddressType, U("SMTP")},
                     {kPidSentRepresentingAddressType, U("SMTP")}});
}

inline Attachment FileAttachment(const std::string& name, Bytes data, const std::string& mime) {
  Attachment a;
  a.properties.Set(kPidAttachMethod, PropertyValue::Int32(kAttachByValue));
  a.properties.Set(kPidAttachFilename, U(name));
  a.properties.Set(kPidAttachLongFilename, U(name));
  a.properties.Set(kPidAttachMimeTag, U(mime));
  a.data = std::move(data);
  return a;
}

// Every property, recipient and attachment written is read back (the
// store may add some).
inline void ExpectBagContains(const PropertyBag& read, const PropertyBag& written,
                              const std::string& what) {
  for (const auto& [id, value] : written.tagged()) {
    if (id == kPidHasAttachments || id == kPidMessageSize) continue;
    const PropertyValue* got = read.Find(id);
    ASSERT_NE(got, nullptr) << what << ": property 0x" << std::hex << id << " lost";
    EXPECT_EQ(*got, value) << what << ": property 0x" << std::hex << id;
  }
  for (const auto& [name, value] : written.named()) {
    const PropertyValue* got = read.FindNamed(name);
    ASSERT_NE(got, nullptr) << what << ": named property " << name.lid << name.name << " lost";
    EXPECT_EQ(*got, value) << what << ": named property " << name.lid << name.name;
  }
}

inline void ExpectMessageContains(const Message& read, const Message& written,
                                  const std::string& what) {
  ExpectBagContains(read.properties, written.properties, what);
  ASSERT_EQ(read.recipients.size(), written.recipients.size()) << what;
  for (size_t i = 0; i < written.recipients.size(); ++i) {
    ExpectBagContains(read.recipients[i], written.recipients[i], what + " recipient");
  }
  ASSERT_EQ(read.attachments.size(), written.attachments.size()) << what;
  for (size_t i = 0; i < written.attachments.size(); ++i) {
    const Attachment& w = written.attachments[i];
    const Attachment& r = read.attachments[i];
    ExpectBagContains(r.properties, w.properties, what + " attachment");
    EXPECT_EQ(r.data, w.data) << what << " attachment " << i;
    ASSERT_EQ(r.embedded != nullptr, w.embedded != nullptr) << what << " attachment " << i;
    if (w.embedded) ExpectMessageContains(*r.embedded, *w.embedded, what + " embedded");
  }
}

// Checks one message of ours against the item pffexport exported for it.
inline void CompareItem(const Message& ours, const ExportedItem& theirs, const std::string& where) {
  std::string subject = ours.properties.String(kPidSubject).value_or("");
  EXPECT_EQ(Field(theirs.description, "Subject"), subject) << where;
  EXPECT_EQ(theirs.recipients.size(), ours.recipients.size()) << where << " " << subject;
  for (size_t i = 0; i < ours.recipients.size() && i < theirs.recipients.size(); ++i) {
    EXPECT_EQ(theirs.recipients[i].at("Display name"),
              ours.recipients[i].String(kPidDisplayName).value_or(""))
        << where << " " << subject;
  }
  size_t data_attachments = 0, embedded = 0;
  for (const Attachment& a : ours.attachments) {
    if (a.embedded) {
      ++embedded;
    } else if (!a.data.empty()) {
      ++data_attachments;
    }
  }
  EXPECT_EQ(theirs.attachments.size(), data_attachments) << where << " " << subject;
  EXPECT_EQ(theirs.embedded.size(), embedded) << where << " " << subject;
  // pffexport names data attachments "<n>_<file name>"; the bytes must match.
  for (const auto& [name, bytes] : theirs.attachments) {
    bool matched = false;
    for (const Attachment& a : ours.attachments)
      matched = matched || (!a.embedded && a.data == bytes);
    EXPECT_TRUE(matched) << where << " " << subject << ": attachment " << name;
  }
}

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PST_TEST_SUPPORT_H_
