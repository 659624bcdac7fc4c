#include "render/eml_composer.h"

#include <cstdio>

#include "base/date_time.h"
#include "base/text.h"

namespace tarnwell::render {
namespace {

inline constexpr char kUnknownAttachment[] = "Unknown";
inline constexpr char kRtfBodyName[] = "rtf-body.rtf";
constexpr size_t kRtfClosingBytes = 4;  // the expanded RTF ends with " }}\0"

// The charset header texts are encoded in.
std::string HeaderCharset(const ComposeOptions& o) {
  if (o.store_text) return "utf-8";
  const char* name = IconvNameForCodePage(o.ansi_code_page);
  return name ? AsciiLower(name) : "windows-1252";
}

void SetHeaders(CMimeMessage& m, const HeaderStrings& h, store::FileTime date,
                const ComposeOptions& o) {
  const std::string charset = HeaderCharset(o);
  const std::pair<const char*, const std::string*> fields[] = {
      {"From", &h.from}, {"To", &h.to}, {"CC", &h.cc}, {"BCC", &h.bcc}, {"Subject", &h.subject}};
  for (const auto& [name, value] : fields) {
    if (!value->empty()) m.SetFieldValue(name, ToValidUtf8(*value), charset);
  }
  int y, mo, d, hh, mi, s;
  if (!h.date_text.empty()) {
    if (ParseDateText(h.date_text, &y, &mo, &d, &hh, &mi, &s)) m.SetDate(y, mo, d, hh, mi, s);
  } else if (date) {
    if (std::optional<std::tm> t = FileTimeToTm(*date, Zone::kLocal)) {
      m.SetDate(t->tm_year + 1900, t->tm_mon + 1, t->tm_mday, t->tm_hour, t->tm_min, t->tm_sec);
    }
  }
  m.SetFieldValue("X-Priority", "3 (Normal)");
  m.SetFieldValue("X-My-Field", "My value");
  m.SetFieldValue("Content-Type", "multipart/mixed");
  m.SetBoundary();
}

void AddAttachments(CMimeMessage& m, std::vector<store::AttachmentRecord>& attachments) {
  for (store::AttachmentRecord& a : attachments) {
    CMimeBody* part = m.CreatePart("application");
    part->SetFieldValue("Content-Transfer-Encoding", "base64");
    const std::string name = a.name.empty() ? kUnknownAttachment : ToValidUtf8(a.name);
    part->SetContent(name, std::move(a.data));
    if (!a.name.empty()) part->SetFieldValue("Content-ID", name, "utf-8");
  }
}

void AddRtf(CMimeMessage& m, const std::optional<Bytes>& rtf) {
  if (!rtf) return;
  ByteView text(*rtf);
  // The expanded RTF carries its closing " }}" and a NUL: keep the RTF text.
  if (text.size() >= kRtfClosingBytes && text[text.size() - 1] == 0) {
    text = text.Sub(0, text.size() - 1);
  }
  CMimeBody* part = m.CreatePart("application");
  part->SetFieldValue("Content-Transfer-Encoding", "base64");
  part->SetFieldValue("Content-Type", "application/rtf");
  part->SetContent(kRtfBodyName, text);
}

Status Finish(CMimeMessage& m, MimeSink* out) { return m.Store(out); }

// Text that is UTF-8 beyond ASCII must say so, or readers take it as ASCII
// and lose every other character.
bool NeedsCharset(const std::string& text) {
  for (unsigned char c : text) {
    if (c >= 0x80) return IsValidUtf8(text);
  }
  return false;
}

// A plain-text body has no fields of its own, unless it needs its charset.
void SetPlainText(CMimeBody* body, const std::string& text) {
  if (NeedsCharset(text)) {
    body->SetFieldValue("Content-Type", "text/plain");
    body->SetParameter("Content-Type", "charset", "utf-8");
  }
  body->SetText(text);
}

}  // namespace

bool ParseDateText(const std::string& text, int* year, int* month, int* day, int* hour, int* minute,
                   int* second) {
  char tail = 0;
  if (std::sscanf(text.c_str(), "%d/%d/%d %d:%d:%d%c", day, month, year, hour, minute, second,
                  &tail) != 6) {
    return false;
  }
  return *month >= 1 && *month <= 12 && *day >= 1 && *day <= 31 && *hour >= 0 && *hour < 24 &&
         *minute >= 0 && *minute < 60 && *second >= 0 && *second < 61 && *year > 0;
}

Status ComposeMessage(const store::MessageRecord& message, store::FileTime date,
                      std::vector<store::AttachmentRecord>& attachments,
                      const HeaderStrings& headers, const ComposeOptions& options, MimeSink* out) {
  CMimeMessage m;
  SetHeaders(m, headers, date, options);
  CMimeBody* body = m.CreatePart();
  if (!message.body.empty() && !message.body_is_text) {
    // An HTML body, as its bytes stand.
    const std::string html = ByteView(message.body).ToString();
    body->SetFieldValue("Content-Type", "text/html");
    if (NeedsCharset(html)) body->SetParameter("Content-Type", "charset", "utf-8");
    body->SetFieldValue("Content-Transfer-Encoding", "quoted-printable");
    body->SetText(html);
  } else if (!message.body.empty() && !message.rtf_body) {
    SetPlainText(body, ByteView(message.body).ToString());
  }
  AddAttachments(m, attachments);
  AddRtf(m, message.rtf_body);
  return Finish(m, out);
}

Status ComposeTask(const store::TaskRecord& task, const std::optional<Bytes>& rtf,
                   store::FileTime date, std::vector<store::AttachmentRecord>& attachments,
                   const HeaderStrings& headers, const ComposeOptions& options, MimeSink* out) {
  CMimeMessage m;
  SetHeaders(m, headers, date, options);
  CMimeBody* body = m.CreatePart();
  if (!task.body_text.empty()) SetPlainText(body, task.body_text);
  AddAttachments(m, attachments);
  AddRtf(m, rtf);
  return Finish(m, out);
}

Status ComposeCarrier(const std::string& media_type, const std::string& file_name,
                      const std::string& text, store::FileTime date,
                      std::vector<store::AttachmentRecord>& attachments,
                      const HeaderStrings& headers, const ComposeOptions& options, MimeSink* out) {
  CMimeMessage m;
  SetHeaders(m, headers, date, options);
  CMimeBody* part = m.CreatePart();
  part->SetFieldValue("Content-Type", media_type);
  part->SetText(text);
  part->SetName(file_name);
  AddAttachments(m, attachments);
  return Finish(m, out);
}

}  // namespace tarnwell::render
