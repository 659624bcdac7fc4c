#include "cli/store_commands.h"

#include <fmt/format.h>
#include <openssl/evp.h>

#include "base/date_time.h"
#include "base/json_writer.h"
#include "base/text.h"
#include "store/distribution_list.h"

namespace tarnwell::cli {
namespace {

std::string Sha256Hex(ByteView data) {
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  EVP_Digest(data.data(), data.size(), digest, &length, EVP_sha256(), nullptr);
  return ToHex(ByteView(digest, length));
}

std::string PathText(const std::vector<std::string>& path) {
  std::string out;
  for (size_t i = 0; i < path.size(); ++i) {
    if (i) out += " / ";
    out += path[i];
  }
  return out;
}

// A message key as its 8 bytes stand in the database.
std::string KeyHex(uint64_t key) {
  uint8_t bytes[8];
  StoreU64LE(bytes, key);
  return ToHex(ByteView(bytes, sizeof bytes));
}

std::string TimeText(const store::FileTime& t) { return t ? DateText(*t) : ""; }

void KeyTime(JsonWriter& w, const char* key, const store::FileTime& t) {
  if (t) w.Key(key).String(DateText(*t));
}

void KeyString(JsonWriter& w, const char* key, const std::string& value) {
  if (!value.empty()) w.Key(key).String(ToValidUtf8(value));
}

void StringMap(JsonWriter& w, const char* key, const std::map<std::string, std::string>& values) {
  if (values.empty()) return;
  w.Key(key).BeginObject();
  for (const auto& [name, value] : values) w.Key(name).String(ToValidUtf8(value));
  w.EndObject();
}

void WriteBody(JsonWriter& w, const store::MessageRecord& m) {
  if (!m.body.empty()) {
    w.Key("body").String(ToValidUtf8(ByteView(m.body).ToString()));
    w.Key("body_is_text").Bool(m.body_is_text);
  }
  if (m.rtf_body) {
    // The expanded text carries its closing bytes; show the RTF alone.
    std::string rtf = ByteView(*m.rtf_body).ToString();
    while (!rtf.empty() && rtf.back() == '\0') rtf.pop_back();
    w.Key("rtf").String(ToValidUtf8(rtf));
  }
}

void WriteRecord(JsonWriter& w, store::DecodePurpose purpose, const store::ItemRecords& r) {
  using store::DecodePurpose;
  switch (purpose) {
    case DecodePurpose::kContactDetail: {
      const store::ContactRecord& c = r.contact;
      StringMap(w, "strings", c.strings);
      KeyTime(w, "birthday", c.birthday);
      KeyTime(w, "anniversary", c.anniversary);
      if (c.gender) w.Key("gender").Uint(c.gender);
      break;
    }
    case DecodePurpose::kAppointmentDetail: {
      const store::AppointmentRecord& a = r.appointment;
      KeyTime(w, "start", a.start_time);
      KeyTime(w, "end", a.end_time);
      KeyTime(w, "created", a.creation_time);
      KeyString(w, "body", a.body_text);
      StringMap(w, "strings", a.strings);
      if (a.sensitivity) w.Key("sensitivity").Uint(a.sensitivity);
      break;
    }
    case DecodePurpose::kTaskDetail: {
      const store::TaskRecord& t = r.task;
      w.Key("times").BeginArray();
      for (const auto& time : t.times) w.String(TimeText(time));
      w.EndArray();
      KeyString(w, "body", t.body_text);
      StringMap(w, "strings", t.strings);
      w.Key("percent_complete").Double(t.percent_complete);
      if (t.priority) w.Key("priority").Uint(t.priority);
      break;
    }
    default: {
      const store::MessageRecord& m = r.message;
      WriteBody(w, m);
      KeyTime(w, "creation_time", m.creation_time);
      KeyString(w, "transport_headers", m.transport_headers);
      StringMap(w, "strings", m.strings);
      if (!m.members.empty()) {
        w.Key("members").BeginArray();
        for (const store::ListMember& member : m.members) {
          w.BeginObject();
          w.Key("name").String(ToValidUtf8(member.display_name));
          w.Key("type").String(ToValidUtf8(member.address_type));
          w.Key("address").String(ToValidUtf8(member.email_address));
          w.EndObject();
        }
        w.EndArray();
      }
      break;
    }
  }
}

const char* PurposeName(store::DecodePurpose p) {
  switch (p) {
    case store::DecodePurpose::kContactDetail:
      return "contact";
    case store::DecodePurpose::kAppointmentDetail:
      return "appointment";
    case store::DecodePurpose::kTaskDetail:
      return "task";
    default:
      return "message";
  }
}

}  // namespace

std::string ImportanceText(uint32_t importance) {
  switch (importance) {
    case 0:
      return "Low";
    case 1:
      return "Normal";
    case 2:
      return "High";
    default:
      return "";
  }
}

ListRow MakeListRow(const store::MessageSummary& s) {
  ListRow row;
  row.to = s.to;
  row.from = s.sender;
  row.subject = s.subject;
  row.has_attachment = fmt::format("{}", int(s.has_attachments));
  row.created = s.created;
  row.type = s.message_class.empty() ? "IPM.Note" : s.message_class;
  row.importance = ImportanceText(s.importance);
  row.status = s.flags_text;
  row.modified = s.modified;
  row.arrival = s.received;
  row.key = s.message_key;
  return row;
}

std::string FormatScanText(StoreSession& session) {
  std::string out = session.top_text() + "\n";
  for (const ShownFolder& f : session.folders()) {
    out += fmt::format("{:>{}}{}  [{}]\n", "", 2 * (f.path.size() - 1), f.path.back(), f.ref);
  }
  return out;
}

std::string FormatScanJson(StoreSession& session, const ScanOptions& options) {
  JsonWriter w;
  w.BeginObject();
  w.Key("source").String(options.db);
  w.Key("version").String(VersionName(session.source().version_code));
  w.Key("mode").String(options.mode);
  w.Key("public_store").Bool(session.store().public_store());
  w.Key("folders").BeginArray();
  for (const ShownFolder& f : session.folders()) {
    const store::FolderNode* found = session.store().Folder(f.folder);
    if (!found) continue;
    const store::FolderNode& node = *found;
    w.BeginObject();
    w.Key("ref").String(f.ref);
    w.Key("path").BeginArray();
    for (const std::string& p : f.path) w.String(ToValidUtf8(p));
    w.EndArray();
    w.Key("name").String(ToValidUtf8(node.display_name));
    w.Key("id").Uint(node.folder_id);
    w.Key("parent").Uint(node.parent_id);
    w.Key("class").String(ToValidUtf8(node.container_class));
    w.Key("icon").Int(f.icon);
    w.EndObject();
  }
  w.EndArray();
  w.EndObject();
  return w.str() + "\n";
}

Status RunList(StoreSession& session, const std::string& ref, bool json, std::string* out) {
  const ShownFolder* folder = session.FindFolder(ref);
  if (!folder) return Status::NotFound("no folder with reference \"" + ref + "\"");
  session.BeginJob();
  std::vector<store::MessageSummary> rows = session.store().ListFolder(folder->folder);
  JsonWriter w;
  if (json) w.BeginArray();
  for (const store::MessageSummary& s : rows) {
    ListRow r = MakeListRow(s);
    if (json) {
      w.BeginObject();
      w.Key("To").String(ToValidUtf8(r.to));
      w.Key("From").String(ToValidUtf8(r.from));
      w.Key("Subject").String(ToValidUtf8(r.subject));
      w.Key("Has Attachment").String(r.has_attachment);
      w.Key("Created Date Time").String(r.created);
      w.Key("Type").String(ToValidUtf8(r.type));
      w.Key("Importance").String(r.importance);
      w.Key("Message Status").String(r.status);
      w.Key("Modify Date Time").String(r.modified);
      w.Key("Arrival Date Time").String(r.arrival);
      w.Key("key").String(KeyHex(r.key));
      w.EndObject();
    } else {
      *out += fmt::format("{}\t{}\t{}\t{}\t{}\t{}\t{}\t{}\t{}\t{}\t{}\n", r.to, r.from, r.subject,
                          r.has_attachment, r.created, r.type, r.importance, r.status, r.modified,
                          r.arrival, KeyHex(r.key));
    }
  }
  if (json) {
    w.EndArray();
    *out = w.str() + "\n";
  } else {
    *out += fmt::format("{} items are found\n", rows.size());
  }
  return Status::Ok();
}

Status RunShow(StoreSession& session, const std::string& ref, size_t item, bool json,
               std::string* out) {
  const ShownFolder* folder = session.FindFolder(ref);
  if (!folder) return Status::NotFound("no folder with reference \"" + ref + "\"");
  session.BeginJob();
  std::vector<store::MessageSummary> rows = session.store().ListFolder(folder->folder);
  if (item == 0 || item > rows.size()) {
    return Status::NotFound(fmt::format("no item {} in a folder of {} items", item, rows.size()));
  }
  const store::MessageSummary& row = rows[item - 1];
  store::DecodePurpose purpose = store::DecodePurpose::kMessageDetail;
  std::optional<store::ItemRecords> record =
      session.store().OpenMessage(folder->folder, row.message_key, &purpose);
  if (!record) {
    return Status::NotFound("the message " + KeyHex(row.message_key) +
                            " of the folder list has no record in the message table");
  }
  std::vector<store::AttachmentRecord> attachments =
      session.store().ListAttachments(folder->folder, row.message_key);
  JsonWriter w;
  w.BeginObject();
  w.Key("key").String(KeyHex(row.message_key));
  w.Key("kind").String(PurposeName(purpose));
  const ListRow list = MakeListRow(row);
  w.Key("class").String(ToValidUtf8(list.type));
  w.Key("subject").String(ToValidUtf8(list.subject));
  w.Key("from").String(ToValidUtf8(list.from));
  w.Key("to").String(ToValidUtf8(list.to));
  w.Key("created").String(list.created);
  w.Key("modified").String(list.modified);
  w.Key("received").String(list.arrival);
  w.Key("status").String(list.status);
  WriteRecord(w, purpose, *record);
  w.Key("attachments").BeginArray();
  for (const store::AttachmentRecord& a : attachments) {
    w.BeginObject();
    w.Key("name").String(ToValidUtf8(a.name));
    w.Key("size").Uint(a.data.size());
    w.Key("sha256").String(Sha256Hex(ByteView(a.data)));
    w.EndObject();
  }
  w.EndArray();
  w.EndObject();
  if (json) {
    *out = w.str() + "\n";
  } else {
    // The text form is the same content, one field per line.
    *out = fmt::format(
        "Folder:   {}\nKind:     {}\nClass:    {}\nSubject:  {}\nFrom:     {}\n"
        "To:       {}\nCreated:  {}\nReceived: {}\n",
        PathText(folder->path), PurposeName(purpose), list.type, list.subject, list.from, list.to,
        list.created, list.arrival);
    for (const store::AttachmentRecord& a : attachments) {
      *out += fmt::format("Attachment: {} ({} bytes, sha256 {})\n", a.name, a.data.size(),
                          Sha256Hex(ByteView(a.data)));
    }
    *out += "JSON:     " + w.str() + "\n";
  }
  return Status::Ok();
}

}  // namespace tarnwell::cli
