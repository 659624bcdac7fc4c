#include "testing/exchange/store_manifest.h"

#include <openssl/evp.h>

#include <cstdio>

#include "base/json_writer.h"
#include "base/text.h"

namespace tarnwell::forge::exchange {
namespace {

struct IconRule {
  const char* name;
  int icon;
};

constexpr IconRule kIconRules[] = {
    {"Junk E-mail", 14},    {"Inbox", 3},
    {"Outbox", 6},          {"RSS Feeds", 17},
    {"Sent Items", 7},      {"Drafts", 2},
    {"Deleted Items", 16},  {"Large Mail", 15},
    {"Unread Mail", 15},    {"Categorized Mail", 15},
    {"Search Folders", 15}, {"Search", 15},
    {"Calendar", 1},        {"Tasks", 8},
    {"Journal", 4},         {"Notes", 5},
    {"Contacts", 10},
};

std::string Hex(const Bytes& b) { return ToHex(ByteView(b)); }

// `key`: an object of the map's entries, each value written by `put`.
template <typename Map, typename Put>
void MapObject(JsonWriter& w, const char* key, const Map& map, Put put) {
  w.Key(key).BeginObject();
  for (const auto& [k, v] : map) put(w.Key(k), v);
  w.EndObject();
}

void KeySubjects(JsonWriter& w, const char* key, const std::vector<DuplicateRow>& rows) {
  w.Key(key).BeginArray();
  for (const DuplicateRow& d : rows) {
    w.BeginObject();
    w.Key("key").String(Hex(d.key));
    w.Key("subject").String(d.subject);
    w.EndObject();
  }
  w.EndArray();
}

void Attachment(JsonWriter& w, const ManifestAttachment& a) {
  w.BeginObject();
  w.Key("key").String(Hex(a.key));
  w.Key("name").String(a.name);
  w.Key("display_name").String(a.display_name);
  w.Key("file_name").String(a.file_name);
  w.Key("long_file_name").String(a.long_file_name);
  w.Key("size").Uint(a.size);
  w.Key("sha256").String(a.sha256);
  w.Key("long_value").Bool(a.long_value);
  w.Key("method").Uint(a.method);
  w.EndObject();
}

void Item(JsonWriter& w, const ManifestItem& it) {
  w.BeginObject();
  w.Key("key").String(Hex(it.key));
  w.Key("class").String(it.message_class);
  w.Key("subject").String(it.subject);
  w.Key("subject_prefix").String(it.subject_prefix);
  w.Key("normalized_subject").String(it.normalized_subject);
  w.Key("sender").String(it.sender);
  w.Key("to").String(it.to);
  w.Key("to_shown").String(it.to_shown);
  w.Key("sender_shown").String(it.sender_shown);
  w.Key("created").Uint(it.created);
  w.Key("modified").Uint(it.modified);
  w.Key("received").Uint(it.received);
  w.Key("flags").Uint(it.flags);
  w.Key("importance").Uint(it.importance);
  w.Key("has_attachments").Bool(it.has_attachments);
  w.Key("in_msg_table").Bool(it.in_msg_table);
  w.Key("body_text").String(it.body_text);
  w.Key("body_html").String(it.body_html);
  w.Key("rtf_text").String(it.rtf_text);
  w.Key("rtf_uses_references").Bool(it.rtf_uses_references);
  w.Key("body_long_value").Bool(it.body_long_value);
  w.Key("headers").String(it.headers);
  MapObject(w, "strings", it.strings, [](JsonWriter& v, const auto& x) { v.String(x); });
  MapObject(w, "times", it.times, [](JsonWriter& v, auto x) { v.Uint(x); });
  MapObject(w, "numbers", it.numbers, [](JsonWriter& v, auto x) { v.Int(x); });
  MapObject(w, "doubles", it.doubles, [](JsonWriter& v, auto x) { v.Double(x); });
  w.Key("members").BeginArray();
  for (const ListMember& m : it.members) {
    w.BeginObject();
    w.Key("name").String(m.name);
    w.Key("type").String(m.address_type);
    w.Key("address").String(m.address);
    w.EndObject();
  }
  w.EndArray();
  w.Key("cc").String(it.cc);
  w.Key("flags_text").String(it.flags_text);
  w.Key("body_type").Uint(it.body_type);
  w.Key("document_id").Int(it.document_id);
  w.Key("attachments").BeginArray();
  for (const ManifestAttachment& a : it.attachments) Attachment(w, a);
  w.EndArray();
  w.EndObject();
}

void Folder(JsonWriter& w, const ManifestFolder& f) {
  w.BeginObject();
  w.Key("id").Uint(f.id);
  w.Key("parent").Uint(f.parent);
  w.Key("name").String(f.name);
  w.Key("class").String(f.container_class);
  w.Key("path").BeginArray();
  for (const std::string& p : f.path) w.String(p);
  w.EndArray();
  w.Key("content_name").String(f.content_name);
  w.Key("content_table").String(f.content_table);
  w.Key("visible").Bool(f.visible);
  w.Key("icon").Int(f.icon);
  w.Key("row").Uint(f.row);
  w.Key("damage").String(f.damage);
  w.Key("item_count").Uint(f.item_count);
  w.Key("items").BeginArray();
  for (const ManifestItem& it : f.items) Item(w, it);
  w.EndArray();
  w.EndObject();
}

}  // namespace

std::string Sha256Hex(ByteView data) {
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int size = 0;
  if (!EVP_Digest(data.data(), data.size(), digest, &size, EVP_sha256(), nullptr)) return "";
  return ToHex(ByteView(digest, size));
}

int FolderIcon(const std::string& name) {
  std::string trimmed = name;
  while (!trimmed.empty() && (trimmed.back() == ' ' || trimmed.back() == '\t' ||
                              trimmed.back() == '\r' || trimmed.back() == '\n')) {
    trimmed.pop_back();
  }
  for (const IconRule& rule : kIconRules) {
    if (EqualsIgnoreAsciiCase(trimmed, rule.name)) return rule.icon;
  }
  return kIconOther;
}

std::string ManifestJson(const StoreManifest& m) {
  JsonWriter w;
  w.BeginObject();
  w.Key("version").Int(m.version);
  w.Key("public_store").Bool(m.public_store);
  w.Key("page_size").Uint(m.page_size);
  w.Key("revision").Uint(m.revision);
  w.Key("attachment_table").String(m.attachment_table);
  w.Key("attachment_key_column").String(m.attachment_key_column);
  MapObject(w, "time_encodings", m.time_encodings,
            [](JsonWriter& v, const auto& x) { v.String(x); });
  w.Key("mailboxes").BeginArray();
  for (const ManifestMailbox& mb : m.mailboxes) {
    w.BeginObject();
    w.Key("name").String(mb.name);
    w.Key("number").Uint(mb.number);
    w.Key("property").String(Hex(mb.property));
    w.Key("row").Uint(mb.row);
    w.Key("folder_table").String(mb.folder_table);
    w.Key("message_table").String(mb.message_table);
    w.Key("attachment_table").String(mb.attachment_table);
    w.Key("header_table").String(mb.header_table);
    w.Key("damage").String(mb.damage);
    w.EndObject();
  }
  w.EndArray();
  w.Key("folders").BeginArray();
  for (const ManifestFolder& f : m.folders) Folder(w, f);
  w.EndArray();
  KeySubjects(w, "duplicates", m.duplicates);
  w.Key("later_2013_variant").Bool(m.later_2013_variant);
  w.Key("real_layout").Bool(m.real_layout);
  KeySubjects(w, "unmapped", m.unmapped);
  w.Key("msg_rows").Uint(m.msg_rows);
  w.Key("messages").Uint(m.messages);
  w.Key("attachment_rows").Uint(m.attachment_rows);
  w.Key("items_recorded").Bool(m.items_recorded);
  w.EndObject();
  return w.str() + "\n";
}

}  // namespace tarnwell::forge::exchange
