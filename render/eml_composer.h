// The EML composer: one item as an Internet message.
//
// Header fields, in this order, each only when its text is not empty:
// "From", "To", "CC", "BCC", "Subject"; then "Date", "X-Priority" =
// "3 (Normal)", "X-My-Field" = "My value" and "Content-Type" =
// "multipart/mixed" with a boundary. Then the parts:
//
//   1. the body: with an HTML body, text/html quoted-printable; else, with a
//      plain-text body and no RTF body, the plain text with no fields of its
//      own; else an empty part
//   2. one base64 part per attachment (a nameless one is called "Unknown"),
//      with "Content-ID" = its file name
//   3. with an RTF body, "rtf-body.rtf" as application/rtf, base64
//
// With the store-text flag on, header texts go out as one UTF-8 encoded
// word (split into several only where one line would pass the 998-octet
// limit); off, in the ANSI code page. Header texts never carry a line break
// taken from the database: CR, LF and NUL become spaces.
#ifndef TARNWELL_RENDER_EML_COMPOSER_H_
#define TARNWELL_RENDER_EML_COMPOSER_H_

#include <string>
#include <vector>

#include "base/status.h"
#include "render/mime/mime_message.h"
#include "render/mime/mime_sink.h"
#include "store/item_records.h"

namespace tarnwell::render {

struct HeaderStrings {
  std::string to, from, cc, bcc, subject;
  std::string date_text;  // "%d/%m/%Y %H:%M:%S" local time, as the item list shows it
};

struct ComposeOptions {
  bool store_text = true;  // UTF-8 header texts; off: the ANSI code page
  uint32_t ansi_code_page = 1252;
};

// A mail-like item (mail, post, note, journal entry, anything without a
// writer of its own).
// The attachments' data is moved into the message, so that a large
// attachment is held once.
Status ComposeMessage(const store::MessageRecord& message, store::FileTime date,
                      std::vector<store::AttachmentRecord>& attachments,
                      const HeaderStrings& headers, const ComposeOptions& options, MimeSink* out);

// A task: its plain-text body, no HTML part, its RTF body if any.
Status ComposeTask(const store::TaskRecord& task, const std::optional<Bytes>& rtf,
                   store::FileTime date, std::vector<store::AttachmentRecord>& attachments,
                   const HeaderStrings& headers, const ComposeOptions& options, MimeSink* out);

// An item that has a file format of its own (a vCard, an iCalendar file)
// carried in an Internet message: a text part of `media_type` named
// `file_name` holding `text`, then the attachments.
Status ComposeCarrier(const std::string& media_type, const std::string& file_name,
                      const std::string& text, store::FileTime date,
                      std::vector<store::AttachmentRecord>& attachments,
                      const HeaderStrings& headers, const ComposeOptions& options, MimeSink* out);

// Parses the item list's date text ("%d/%m/%Y %H:%M:%S"); false when it is
// not such a date.
bool ParseDateText(const std::string& text, int* year, int* month, int* day, int* hour, int* minute,
                   int* second);

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_EML_COMPOSER_H_
