#include "store/property_decoder.h"

#include <cstring>
#include <optional>

#include "base/date_time.h"
#include "base/text.h"
#include "engine/catalog_entry.h"
#include "store/distribution_list.h"
#include "store/rtf_decompressor.h"
#include "store/typed_binary.h"

namespace tarnwell::store {

namespace {

// The bytes before the two strings of "N67b6".
constexpr size_t kN67b6LeadIn = 5;
// Keys are the first 8 bytes of their column, least significant first.
constexpr size_t kKeySize = 8;
constexpr size_t kFileTimeSize = 8;
constexpr size_t kFloatSize = 4;
constexpr size_t kDoubleSize = 8;

// ---- Purposes and versions as bit sets

constexpr uint32_t Bit(DecodePurpose p) { return 1u << static_cast<unsigned>(p); }

constexpr uint32_t kMailbox = Bit(DecodePurpose::kMailboxRow);
constexpr uint32_t kFolder = Bit(DecodePurpose::kFolderRow);
constexpr uint32_t kList = Bit(DecodePurpose::kMessageListRow);
constexpr uint32_t kMessage = Bit(DecodePurpose::kMessageDetail);
constexpr uint32_t kContact = Bit(DecodePurpose::kContactDetail);
constexpr uint32_t kAppointment = Bit(DecodePurpose::kAppointmentDetail);
constexpr uint32_t kTask = Bit(DecodePurpose::kTaskDetail);
constexpr uint32_t kAttachment = Bit(DecodePurpose::kAttachmentRow);
constexpr uint32_t kItemDetail = kMessage | kContact | kAppointment | kTask;
constexpr uint32_t kAnyPurpose = ~0u;

constexpr uint32_t Version(int code) { return 1u << code; }

constexpr uint32_t kAllVersions = Version(kStoreExchange2000) | Version(kStoreExchange2007) |
                                  Version(kStoreExchange2010) | Version(kStoreExchange55) |
                                  Version(kStoreExchange2013);
constexpr uint32_t kNotExchange55 = kAllVersions & ~Version(kStoreExchange55);

// Between two names of a rule: every name with the same type letters whose
// hexadecimal id lies between them.
constexpr std::string_view kThrough = "..";

bool IsText(uint32_t type) {
  return type == engine::kColumnText || type == engine::kColumnLongText;
}
bool IsBinary(uint32_t type) {
  return type == engine::kColumnBinary || type == engine::kColumnLongBinary;
}

// ---- What a rule's handler sees

struct Column {
  DecodePurpose purpose;
  std::string_view name;
  uint32_t engine_type;
  uint32_t code_page;
  ByteView value;
  ByteOrder binary_time_order;    // for 8-byte binary times
  std::optional<uint64_t> typed;  // a binary value already read by its name
  const PropertyBlobParser* blob_parser;
};

using Handler = int (*)(const Column&, ItemRecords*);

}  // namespace

struct PropertyDecoder::Rule {
  std::vector<std::string_view> names;  // empty: `matches` decides
  uint32_t purposes;
  uint32_t versions;
  Handler handler;
  bool (*matches)(const Column&) = nullptr;
};

namespace {

using C = const Column&;
using R = ItemRecords*;

// ---- Conversions by engine type. Each returns 1 with *out set, 0 when the
// value is not of that kind, -1 when it is too short for its type.

int AsInteger(C c, int64_t* out) {
  if (c.typed) {
    *out = static_cast<int64_t>(*c.typed);
    return 1;
  }
  size_t width = 0;
  bool is_signed = false;
  switch (c.engine_type) {
    case engine::kColumnBit:
    case engine::kColumnUnsignedByte:
      width = 1;
      break;
    case engine::kColumnShort:
      width = 2;
      is_signed = true;
      break;
    case engine::kColumnUnsignedShort:
      width = 2;
      break;
    case engine::kColumnLong:
      width = 4;
      is_signed = true;
      break;
    case engine::kColumnUnsignedLong:
      width = 4;
      break;
    case engine::kColumnCurrency:
    case engine::kColumnLongLong:
      width = 8;
      is_signed = true;
      break;
    default:
      return 0;
  }
  if (c.value.size() < width) return -1;
  const uint8_t* p = c.value.data();
  switch (width) {
    case 1:
      *out = p[0];
      break;
    case 2:
      *out = is_signed ? int64_t(int16_t(LoadU16LE(p))) : int64_t(LoadU16LE(p));
      break;
    case 4:
      *out = is_signed ? int64_t(int32_t(LoadU32LE(p))) : int64_t(LoadU32LE(p));
      break;
    default:
      *out = static_cast<int64_t>(LoadU64LE(p));
      break;
  }
  return 1;
}

int AsFileTime(C c, uint64_t* out) {
  if (c.typed) {
    *out = *c.typed;
    return 1;
  }
  switch (c.engine_type) {
    case engine::kColumnCurrency:
    case engine::kColumnLongLong:
    case engine::kColumnDateTime:
      if (c.value.size() < kFileTimeSize) return -1;
      *out = LoadU64LE(c.value.data());
      return 1;
    case engine::kColumnBinary:
    case engine::kColumnLongBinary:
      // Only an 8-byte binary value is a time; any other is ignored.
      return ReadTypedFileTime(c.value, c.binary_time_order, out) > 0 ? 1 : 0;
    default:
      return 0;
  }
}

int AsDouble(C c, double* out) {
  if (c.engine_type == engine::kColumnFloat) {
    if (c.value.size() < kFloatSize) return -1;
    float f;
    std::memcpy(&f, c.value.data(), kFloatSize);
    *out = f;
    return 1;
  }
  if (c.engine_type == engine::kColumnDouble) {
    if (c.value.size() < kDoubleSize) return -1;
    std::memcpy(out, c.value.data(), kDoubleSize);
    return 1;
  }
  return 0;
}

// Text columns only; a binary value under a string name is not text.
int AsText(C c, std::string* out) {
  if (!IsText(c.engine_type)) return 0;
  *out = c.code_page == kCodePageUtf16LE ? Utf16LEToUtf8(c.value)
                                         : CodePageToUtf8(c.value, c.code_page);
  // Values are often stored with their terminator.
  while (!out->empty() && out->back() == '\0') out->pop_back();
  return 1;
}

// The NUL-terminated 8-bit string at *pos (to the end when there is no NUL);
// *pos moves past the terminator.
std::string CString(C c, ByteView bytes, size_t* pos) {
  size_t end = *pos;
  while (end < bytes.size() && bytes[end] != 0) ++end;
  std::string text = CodePageToUtf8(bytes.Sub(*pos, end - *pos), c.code_page);
  *pos = end < bytes.size() ? end + 1 : end;
  return text;
}

// ---- Storing helpers

template <typename T>
int SetInteger(C c, T* field) {
  int64_t v = 0;
  const int k = AsInteger(c, &v);
  if (k > 0) *field = static_cast<T>(v);
  return k;
}

// 0/1 from any integer-typed value.
template <typename T>
int SetBoolean(C c, T* field) {
  int64_t v = 0;
  const int k = AsInteger(c, &v);
  if (k > 0) *field = v != 0 ? 1 : 0;
  return k;
}

int SetTime(C c, FileTime* field) {
  uint64_t t = 0;
  const int k = AsFileTime(c, &t);
  if (k > 0) *field = t;
  return k;
}

int SetTimeIfUnset(C c, FileTime* field) { return field->has_value() ? 0 : SetTime(c, field); }

int SetDateText(C c, std::string* field) {
  uint64_t t = 0;
  const int k = AsFileTime(c, &t);
  if (k > 0) *field = DateText(t);
  return k;
}

int SetText(C c, std::string* field) { return AsText(c, field); }

int SetListed(C c, std::map<std::string, std::string>* strings) {
  std::string text;
  const int k = AsText(c, &text);
  if (k > 0) (*strings)[std::string(c.name)] = std::move(text);
  return k;
}

// A string kept in its own field and, under its name, with the others.
int SetTextAndListed(C c, std::string* field, std::map<std::string, std::string>* strings) {
  const int k = AsText(c, field);
  if (k > 0) (*strings)[std::string(c.name)] = *field;
  return k;
}

int SetBytes(C c, Bytes* field) {
  *field = c.value.ToBytes();
  return 1;
}

int SetKey(C c, uint64_t* field) {
  if (c.value.size() < kKeySize) return 0;
  *field = LoadU64LE(c.value.data());
  return 1;
}

// Fields every item detail record has, chosen by the purpose.
uint8_t* ResponseRequested(C c, R r) {
  switch (c.purpose) {
    case DecodePurpose::kMessageDetail:
      return &r->message.response_requested;
    case DecodePurpose::kContactDetail:
      return &r->contact.response_requested;
    case DecodePurpose::kAppointmentDetail:
      return &r->appointment.response_requested;
    default:
      return &r->task.response_requested;
  }
}
uint8_t* ReassignmentProhibited(C c, R r) {
  switch (c.purpose) {
    case DecodePurpose::kMessageDetail:
      return &r->message.reassignment_prohibited;
    case DecodePurpose::kContactDetail:
      return &r->contact.reassignment_prohibited;
    case DecodePurpose::kAppointmentDetail:
      return &r->appointment.reassignment_prohibited;
    default:
      return &r->task.reassignment_prohibited;
  }
}
Bytes* ConversationIndex(C c, R r) {
  switch (c.purpose) {
    case DecodePurpose::kMessageDetail:
      return &r->message.conversation_index;
    case DecodePurpose::kContactDetail:
      return &r->contact.conversation_index;
    case DecodePurpose::kAppointmentDetail:
      return &r->appointment.conversation_index;
    default:
      return &r->task.conversation_index;
  }
}

// ---- Handlers with more to them than one field

// "B2": +1 true, -1 false, so that 0 can stay "absent".
int SetTriState(C c, int32_t* field) {
  int64_t v = 0;
  const int k = AsInteger(c, &v);
  if (k > 0) *field = v != 0 ? 1 : -1;
  return k;
}

int SetReadText(C c, R r) {
  int64_t v = 0;
  const int k = AsInteger(c, &v);
  if (k > 0) r->summary.flags_text = v != 0 ? "Read" : "UnRead";
  return k;
}

int SetFlagsText(C c, R r) {
  int64_t v = 0;
  const int k = AsInteger(c, &v);
  if (k > 0) r->summary.flags_text = MessageFlagsText(static_cast<uint32_t>(v));
  return k;
}

// The list's subject is prefix + normalized subject whichever column comes
// first, so the prefix goes in front and the normalized subject at the end.
int PrependSubject(C c, R r) {
  std::string text;
  const int k = AsText(c, &text);
  if (k > 0) r->summary.subject.insert(0, text);
  return k;
}
int AppendSubject(C c, R r) {
  std::string text;
  const int k = AsText(c, &text);
  if (k > 0) r->summary.subject += text;
  return k;
}

// Plain text becomes the body only when no other body came first.
int SetTextBody(C c, R r) {
  std::string text;
  const int k = AsText(c, &text);
  if (k <= 0) return k;
  if (!r->message.body.empty()) {
    // With an HTML body in place the text still counts: a PST item carries both.
    if (!r->message.body_is_text) r->message.strings["S1000"] = std::move(text);
    return 0;
  }
  r->message.body.assign(text.begin(), text.end());
  r->message.body_is_text = true;
  return 1;
}

int SetNativeBody(C c, R r) {
  Bytes native = c.value.ToBytes();
  // A native body that is not the text itself (HTML) leaves the text among
  // the strings: a PST item carries both.
  if (r->message.body_is_text && !r->message.body.empty() && native != r->message.body) {
    const std::string text(r->message.body.begin(), r->message.body.end());
    if (native != Utf8ToUtf16LE(text)) r->message.strings["S1000"] = text;
  }
  r->message.body = std::move(native);
  r->message.body_is_text = false;
  return 1;
}

int SetRtfBody(C c, R r) {
  std::optional<store::RtfText> rtf = store::DecompressRtf(c.value);
  if (!rtf) return -1;
  r->message.rtf_body = std::move(rtf->text);
  r->message.rtf_compressed_length = c.value.size();
  return 1;
}

// "N67b6": a lead-in of unknown meaning, then two NUL-terminated 8-bit
// strings back to back. A string cut by the end of the value is kept as far
// as it goes.
int SetN67b6(C c, R r) {
  if (c.value.size() <= kN67b6LeadIn) return 0;
  const ByteView rest = c.value.From(kN67b6LeadIn);
  size_t pos = 0;
  r->message.n67b6_first = CString(c, rest, &pos);
  r->message.n67b6_second = CString(c, rest, &pos);
  return 1;
}

// "N3fca": one NUL-terminated 8-bit string from the start of the value.
int SetN3fca(C c, R r) {
  size_t pos = 0;
  r->message.n3fca = CString(c, c.value, &pos);
  return 1;
}

int SetMembers(C c, R r) {
  r->message.members = ParseDistributionList(c.value);
  return r->message.members.empty() ? 0 : 1;
}

// The first of "S3704" (file name) and "S3001" (display name) names the
// attachment; the file name also goes with the row's other strings.
int SetAttachmentName(C c, R r) {
  std::string text;
  const int k = AsText(c, &text);
  if (k <= 0) return k;
  AttachmentRecord& a = r->attachment;
  const bool listed = c.name == "S3704";
  if (listed) a.strings[std::string(c.name)] = text;
  if (a.name.empty()) {
    a.name = std::move(text);
    return 1;
  }
  return listed ? 1 : 0;
}

int SetAppointmentValue(C c, R r) {
  const int k = SetInteger(c, &r->appointment.value);
  if (k > 0 && r->appointment.value != 0) r->appointment.value_present = 1;
  return k;
}

int SetNamedValue(C c, R r) {
  int64_t v = 0;
  const int k = AsInteger(c, &v);
  if (k > 0) r->message.named_values[std::string(c.name)] = static_cast<uint32_t>(v);
  return k;
}

int ParseBlob(C c, R r) {
  if (!c.blob_parser || !*c.blob_parser) return 0;
  return (*c.blob_parser)(c.purpose, c.value, r);
}

bool IsAnyText(C c) { return IsText(c.engine_type); }

// ---- The rules. A value is stored by the first rule that names its column
// and whose purpose is on. Exchange 5.5 stores use the same names and shapes,
// so their rule set is this table without the rules that exclude them.

const std::vector<PropertyDecoder::Rule>& Rules() {
  // clang-format off
  static const std::vector<PropertyDecoder::Rule> rules = {
    // Mailbox and folder rows: the nodes of the folder tree.
    {{"Q6764"}, kMailbox, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->node.folder_id); }},
    {{"MailboxNumber"}, kMailbox, Version(kStoreExchange2013),
     [](C c, R r) { return SetInteger(c, &r->node.folder_id); }},
    {{}, kMailbox, kAllVersions,
     [](C c, R r) { return SetText(c, &r->node.display_name); }, IsAnyText},
    {{"Q6748"}, kFolder, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->node.folder_id); }},
    {{"Q6749"}, kFolder, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->node.parent_id); }},
    {{"S3001", "DisplayName"}, kFolder, kAllVersions,
     [](C c, R r) { return SetText(c, &r->node.display_name); }},
    {{"S3613", "ContainerClass"}, kFolder, kAllVersions,
     [](C c, R r) { return SetText(c, &r->node.container_class); }},

    // Keys, whatever the purpose.
    {{"N67b0"}, kAnyPurpose, kAllVersions,
     [](C c, R r) { return SetKey(c, &r->summary.message_key); }},
    {{"Q3f88", "Q674a"}, kAnyPurpose, kAllVersions,
     [](C c, R r) { return SetKey(c, &r->attachment.key); }},
    {{"BodyType"}, kAnyPurpose, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->message.body_type); }},

    // Message-list rows.
    {{"IsRead"}, kList, kAllVersions, SetReadText},
    {{"Le07"}, kList, kAllVersions, SetFlagsText},
    {{"HasAttachments", "Be1b"}, kList, kAllVersions,
     [](C c, R r) { return SetBoolean(c, &r->summary.has_attachments); }},
    {{"Importance", "L17"}, kList, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->summary.importance); }},
    {{"T3007", "DateCreated"}, kList, kAllVersions,
     [](C c, R r) { return SetDateText(c, &r->summary.created); }},
    {{"T3008", "LastModificationTime"}, kList, kAllVersions,
     [](C c, R r) { return SetDateText(c, &r->summary.modified); }},
    {{"Te06", "DateReceived"}, kList, kAllVersions,
     [](C c, R r) { return SetDateText(c, &r->summary.received); }},
    {{"Se04", "S678e", "DisplayTo"}, kList, kNotExchange55,
     [](C c, R r) { return SetText(c, &r->summary.to); }},
    {{"S42"}, kList, kNotExchange55,
     [](C c, R r) { return SetText(c, &r->summary.sender); }},
    {{"S3d", "SubjectPrefix"}, kList, kAllVersions, PrependSubject},
    {{"Se1d"}, kList, kAllVersions, AppendSubject},
    {{"S1a", "MessageClass"}, kList, kAllVersions,
     [](C c, R r) { return SetText(c, &r->summary.message_class); }},

    // Fields every item detail record has.
    {{"B63"}, kItemDetail, kAllVersions,
     [](C c, R r) { return SetBoolean(c, ResponseRequested(c, r)); }},
    {{"B2b"}, kItemDetail, kAllVersions,
     [](C c, R r) { return SetBoolean(c, ReassignmentProhibited(c, r)); }},
    {{"ConversationIndex", "N71"}, kItemDetail, kAllVersions,
     [](C c, R r) { return SetBytes(c, ConversationIndex(c, r)); }},
    {{"PropertyBlob", "OffPagePropertyBlob"}, kItemDetail, kAllVersions, ParseBlob},
    {{"PropertyBlob", "OffPagePropertyBlob"}, kList, Version(kStoreExchange2013), ParseBlob},

    // Message detail.
    {{"NativeBody", "N1013"}, kMessage, kAllVersions, SetNativeBody},
    {{"S1000"}, kMessage, kAllVersions, SetTextBody},
    {{"N1009"}, kMessage, kAllVersions, SetRtfBody},
    {{"F6659"}, kMessage, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->message.stream_page_list); }},
    {{"N67b4"}, kMessage, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->message.further_binary_1); }},
    {{"N67b3"}, kMessage, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->message.further_binary_2); }},
    {{"N67b6"}, kMessage, kAllVersions, SetN67b6},
    {{"N3fca"}, kMessage, kAllVersions, SetN3fca},
    {{"MN81a9"}, kMessage, kAllVersions, SetMembers},
    {{"MN8165"}, kMessage, Version(kStoreExchange2010), SetMembers},
    {{"T3007", "T8100", "DateCreated"}, kMessage, kAllVersions,
     [](C c, R r) { return SetTimeIfUnset(c, &r->message.creation_time); }},
    {{"T811f", "T807a"}, kMessage, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->message.named_time_1); }},
    {{"T82cc"}, kMessage, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->message.named_time_2); }},
    {{"T82e7"}, kMessage, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->message.named_time_3); }},
    {{"L82e6"}, kMessage, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->message.named_value); }},
    {{"L36"}, kMessage, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->message.sensitivity); }},
    {{"L3fde"}, kMessage, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->message.internet_code_page); }},
    {{"L80df", kThrough, "L80e3", "L82e1", kThrough, "L82e5", "L8128", "L8129", "L8120"},
     kMessage, kAllVersions, SetNamedValue},
    {{"B2"}, kMessage, kAllVersions,
     [](C c, R r) { return SetTriState(c, &r->message.b2); }},
    {{"B23"}, kMessage, kAllVersions,
     [](C c, R r) { return SetBoolean(c, &r->message.b23); }},
    {{"B29"}, kMessage, kAllVersions,
     [](C c, R r) { return SetBoolean(c, &r->message.b29); }},
    {{"B3016"}, kMessage, kAllVersions,
     [](C c, R r) { return SetBoolean(c, &r->message.b3016); }},
    {{"S7d"}, kMessage, kAllVersions,
     [](C c, R r) { return SetText(c, &r->message.transport_headers); }},
    {{"S1042"}, kMessage, kAllVersions,
     [](C c, R r) { return SetText(c, &r->message.in_reply_to); }},
    {{"S50"}, kMessage, kAllVersions,
     [](C c, R r) { return SetText(c, &r->message.reply_recipient_names); }},
    {{"S1046"}, kMessage, kAllVersions,
     [](C c, R r) { return SetText(c, &r->message.s1046); }},
    {{"S8203"}, kMessage, kAllVersions,
     [](C c, R r) { return SetText(c, &r->message.named_string); }},
    {{"MS813a"}, kMessage, kAllVersions,
     [](C c, R r) { return SetText(c, &r->message.named_multi_string); }},
    {{"MS8003", "MS80db", "S8027", "S70", "S82e9", "S82e8"}, kMessage, kAllVersions,
     [](C c, R r) { return SetListed(c, &r->message.strings); }},

    // Contact detail.
    {{"T3a42", "T8159"}, kContact, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->contact.birthday); }},
    {{"T3a41", "T815a"}, kContact, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->contact.anniversary); }},
    {{"I3a4d"}, kContact, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->contact.gender); }},
    {{"L8098"}, kContact, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->contact.contact_value); }},
    {{"S808b"}, kContact, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->contact.s808b, &r->contact.strings); }},
    {{"S3a02", "S3a05", "S3a06", "S3a08", "S3a09", "S3a0a", "S3a11", "S3a16", kThrough, "S3a1f",
      "S3a21", "S3a23", kThrough, "S3a25", "S3a2c", kThrough, "S3a30", "S3a43", kThrough, "S3a48",
      "S3a4b", "S3a4e", "S3a4f", "S3a57", "MS3a58", "S3a59", kThrough, "S3a5d", "S3a5f", kThrough,
      "S3a63", "S8008", "S8009", "S800a", "S800e", "S800f", "S8010", "S801a", kThrough, "S801e",
      "S808d", "S8095", "S8097", "S809c", "S809e", "S80a5", "S80a6", "S80a7", "S8106", "S8110",
      kThrough, "S8114", "S811c", kThrough, "S811f", "S813c", kThrough, "S813f", "S8158", "S81af",
      "S81b0", "S81b4", "S81b5", "S81b9", "S81ba", "S8263", "S8273",
      // Address parts, the web page, post-office boxes, e-mail addresses,
      // free/busy and IM addresses under the numbers the contact writer
      // reads them by.
      "S3a26", kThrough, "S3a2b", "S3a51", "S3a5e", "S3a64", "S802b", "S8045", kThrough, "S804a",
      "S8062", "S8083", "S8093", "S80a3", "S80d8"}, kContact, kAllVersions,
     [](C c, R r) { return SetListed(c, &r->contact.strings); }},

    // Appointment detail. The body text is kept once, outside the list.
    {{"T8198", "T810b", "T814d", "T61", "T8196"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->appointment.end_time); }},
    {{"T8100", "T39", "DateCreated"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->appointment.creation_time); }},
    {{"T814e", "T8197", "T60", "T81ef"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->appointment.start_time); }},
    {{"T8033"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->appointment.named_time); }},
    {{"T8102"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->appointment.named_time_2); }},
    {{"L805c"}, kAppointment, kAllVersions, SetAppointmentValue},
    {{"L81ff"}, kAppointment, Version(kStoreExchange2007), SetAppointmentValue},
    {{"L81e9"}, kAppointment, Version(kStoreExchange2000), SetAppointmentValue},
    {{"B828c"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetBoolean(c, &r->appointment.flag); }},
    {{"B2"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTriState(c, &r->appointment.b2); }},
    {{"L36", "Sensitivity"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->appointment.sensitivity); }},
    {{"S1000"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetText(c, &r->appointment.body_text); }},
    {{"S810c"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->appointment.s810c, &r->appointment.strings); }},
    {{"S8051", "S8201"}, kAppointment, kAllVersions,
     [](C c, R r) {
       return SetTextAndListed(c, &r->appointment.s8051_or_s8201, &r->appointment.strings);
     }},
    {{"S80fd"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->appointment.s80fd, &r->appointment.strings); }},
    {{"S8068"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->appointment.s8068, &r->appointment.strings); }},
    {{"S8186"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->appointment.s8186, &r->appointment.strings); }},
    {{"S8004", "S8009", "S8042", "S8058", "S806b", "S81e6", "S81fc"}, kAppointment, kAllVersions,
     [](C c, R r) { return SetListed(c, &r->appointment.strings); }},

    // Task detail. The body text is kept once, outside the list.
    {{"T8078", "T81ef"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.times[0]); }},
    {{"T811e", "T8079"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.times[1]); }},
    {{"T811f", "T807a"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.times[2]); }},
    {{"Tf"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.times[3]); }},
    {{"T3fef"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.times[4]); }},
    {{"T8125", "T807e"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.time_6); }},
    {{"T39"}, kTask, kAllVersions,
     [](C c, R r) { return SetTime(c, &r->task.time_7); }},
    {{"B8124"}, kTask, kAllVersions,
     [](C c, R r) { return SetBoolean(c, &r->task.flag); }},
    {{"D8121"}, kTask, kAllVersions,
     [](C c, R r) { return AsDouble(c, &r->task.percent_complete); }},
    {{"L8138"}, kTask, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->task.value); }},
    {{"L36", "Sensitivity"}, kTask, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->task.sensitivity); }},
    {{"L26", "Priority"}, kTask, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->task.priority); }},
    {{"L3fde"}, kTask, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->task.internet_code_page); }},
    {{"S1000"}, kTask, kAllVersions,
     [](C c, R r) { return SetText(c, &r->task.body_text); }},
    {{"S814a"}, kTask, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->task.s814a, &r->task.strings); }},
    {{"MS813a"}, kTask, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->task.ms813a, &r->task.strings); }},
    {{"S808b"}, kTask, kAllVersions,
     [](C c, R r) { return SetTextAndListed(c, &r->task.s808b, &r->task.strings); }},
    {{"S8006", "MS8007", "S8016", "S8122"}, kTask, kAllVersions,
     [](C c, R r) { return SetListed(c, &r->task.strings); }},

    // Attachment rows.
    {{"S3704", "S3001", "Name"}, kAttachment, kAllVersions, SetAttachmentName},
    {{"S1a", "S3707", "S3712", "S3713"}, kAttachment, kAllVersions,
     [](C c, R r) { return SetListed(c, &r->attachment.strings); }},
    {{"N3701", "Content"}, kAttachment, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->attachment.data); }},
    {{"J3701"}, kAttachment, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->attachment.further_data); }},
    {{"F3701"}, kAttachment, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->attachment.stream_page_list); }},
    {{"SubobjectsBlob"}, kAttachment, kAllVersions,
     [](C c, R r) { return SetBytes(c, &r->attachment.subobjects); }},
    {{"L65f1"}, kAttachment, kAllVersions,
     [](C c, R r) { return SetInteger(c, &r->attachment.l65f1); }},
  };
  // clang-format on
  return rules;
}

// Splits "MS3a58" into "MS" and 0x3a58; false when the id is not hexadecimal.
bool SplitName(std::string_view name, std::string_view* letters, uint32_t* id) {
  size_t i = 0;
  while (i < name.size() && name[i] >= 'A' && name[i] <= 'Z') ++i;
  if (i == name.size()) return false;
  uint32_t v = 0;
  for (size_t k = i; k < name.size(); ++k) {
    const char ch = name[k];
    const int digit = ch >= '0' && ch <= '9'   ? ch - '0'
                      : ch >= 'a' && ch <= 'f' ? ch - 'a' + 10
                                               : -1;
    if (digit < 0) return false;
    v = v * 16 + uint32_t(digit);
  }
  *letters = name.substr(0, i);
  *id = v;
  return true;
}

// The names a rule lists, with every "first .. last" run written out.
std::vector<std::string> ExpandNames(const std::vector<std::string_view>& names) {
  std::vector<std::string> out;
  for (size_t i = 0; i < names.size(); ++i) {
    if (names[i] != kThrough) {
      out.emplace_back(names[i]);
      continue;
    }
    std::string_view letters_first, letters_last;
    uint32_t first = 0, last = 0;
    if (i == 0 || i + 1 >= names.size() || !SplitName(names[i - 1], &letters_first, &first) ||
        !SplitName(names[i + 1], &letters_last, &last) || letters_first != letters_last) {
      continue;  // a malformed run in the table; its ends are still listed
    }
    for (uint32_t id = first + 1; id < last; ++id) {
      out.push_back(std::string(letters_first) + HexText(id));
    }
  }
  return out;
}

}  // namespace

PropertyDecoder::PropertyDecoder(int store_version) : store_version_(store_version) {
  const uint32_t version = store_version >= 0 && store_version < 32 ? Version(store_version) : 0;
  for (const Rule& rule : Rules()) {
    if (!(rule.versions & version)) continue;
    if (rule.names.empty()) {
      pattern_rules_.push_back(&rule);
      continue;
    }
    for (std::string& name : ExpandNames(rule.names)) {
      rules_by_name_[std::move(name)].push_back(&rule);
    }
  }
}

std::vector<std::string> PropertyDecoder::KnownColumnNames() const {
  std::vector<std::string> names;
  names.reserve(rules_by_name_.size());
  for (const auto& [name, rules] : rules_by_name_) names.push_back(name);
  return names;
}

int PropertyDecoder::Decode(DecodePurpose purpose, std::string_view column_name,
                            uint32_t engine_type, uint32_t code_page, ByteView value,
                            ItemRecords* records) const {
  // An empty value is an absent one.
  if (value.empty() || records == nullptr) return 0;
  const bool tree_row =
      purpose == DecodePurpose::kMailboxRow || purpose == DecodePurpose::kFolderRow;
  Column column{
      purpose, column_name, engine_type, code_page, value,
      // Binary times are little-endian when Exchange 2010 wrote them and
      // in the rows of the folder tree.
      store_version_ == kStoreExchange2010 || tree_row ? ByteOrder::kLittle : ByteOrder::kBig,
      std::nullopt, &blob_parser_};
  // Mailbox and folder rows keep ids and times in binary columns typed by
  // their names; a wrong length makes the value bad whether or not a field
  // wants it.
  if (tree_row && IsBinary(engine_type)) {
    TypedValue typed;
    const int k = DecodeTypedBinary(column_name, value, ByteOrder::kLittle, &typed);
    if (k < 0) return k;
    if (k > 0) column.typed = typed.value;
  }
  const uint32_t bit = Bit(purpose);
  auto found = rules_by_name_.find(std::string(column_name));
  if (found != rules_by_name_.end()) {
    for (const Rule* rule : found->second) {
      if (rule->purposes & bit) return rule->handler(column, records);
    }
  }
  for (const Rule* rule : pattern_rules_) {
    if ((rule->purposes & bit) && rule->matches(column)) return rule->handler(column, records);
  }
  return 0;
}

}  // namespace tarnwell::store
