#include "mapi/import/class_fillers.h"

#include <algorithm>
#include <climits>
#include <ctime>

#include "base/date_text.h"
#include "base/date_time.h"
#include "base/text.h"
#include "mapi/import/internet_message_import.h"
#include "mapi/property_tags.h"

namespace tarnwell::mapi {
namespace {

constexpr std::string_view kSmtp = "SMTP";
constexpr uint64_t kTicksPerMinute = 60 * kFileTimeTicksPerSecond;

// Flags-text words and their PidTagMessageFlags bits. "Attachment" is left out: the store
// computes it from the attachments the item really has.
struct FlagWord {
  std::string_view word;
  int32_t bit;
};
constexpr FlagWord kFlagWords[] = {
    {"Read", kMsgFlagRead}, {"Unmodified", kMsgFlagUnmodified},
    {"Submit", 0x0004},     {"unsent", 0x0008},
    {"From Me", 0x0020},    {"Resend", 0x0080},
    {"NR Pending", 0x0100}, {"NRN pending", 0x0200},
};
constexpr std::string_view kUnread = "UnRead";

// The item class an "IPF." (folder) class stands for.
struct CanonicalClass {
  FillerKind kind;
  std::string_view item_class;
};
constexpr CanonicalClass kCanonicalClasses[] = {
    {FillerKind::kStickyNote, "IPM.StickyNote"},
    {FillerKind::kJournal, "IPM.Activity"},
    {FillerKind::kTask, "IPM.Task"},
    {FillerKind::kDistributionList, "IPM.DistList"},
    {FillerKind::kAppointment, "IPM.Appointment"},
    {FillerKind::kContact, "IPM.Contact"},
};

// Contact strings of the address property set whose column id is their usual long id.
constexpr uint32_t kContactNamedStrings[] = {
    kLidFileUnder,
    0x8010 /* department */,
    kLidHomeAddress,
    kLidWorkAddress,
    kLidOtherAddress,
    0x802B /* home page */,
    kLidWorkAddressStreet,
    kLidWorkAddressCity,
    kLidWorkAddressState,
    kLidWorkAddressPostalCode,
    kLidWorkAddressCountry,
    kLidWorkAddressPostOfficeBox,
    kLidInstantMessagingAddress,
    0x8080,
    0x8082,
    0x8083,
    0x8084,  // Email1 display name, type, address, original name
    0x8090,
    0x8092,
    0x8093,
    0x8094,  // Email2
    0x80A0,
    0x80A2,
    0x80A3,
    0x80A4,  // Email3
    0x80B2,
    0x80B3,
    0x80B4,  // fax 1 address type, address, original display name
    0x80C2,
    0x80C3,
    0x80C4,  // fax 2
    0x80D2,
    0x80D3,
    0x80D4,  // fax 3
    kLidFreeBusyLocation,
};

// Sticky-note and journal values, by column name.
struct NamedColumn {
  std::string_view column;
  uint32_t lid;
};
constexpr NamedColumn kNoteValues[] = {{"L8b00", kLidNoteColor},
                                       {"L8b02", kLidNoteWidth},
                                       {"L8b03", kLidNoteHeight},
                                       {"L8b04", kLidNoteX},
                                       {"L8b05", kLidNoteY}};
constexpr NamedColumn kLogStrings[] = {{"S8700", kLidLogType}, {"S8712", kLidLogTypeDesc}};
constexpr NamedColumn kLogValues[] = {{"L8707", kLidLogDuration}};

constexpr uint32_t kCrc32Polynomial = 0xEDB88320;

uint32_t Crc32(uint32_t crc, ByteView bytes) {
  crc = ~crc;
  for (size_t i = 0; i < bytes.size(); ++i) {
    crc ^= bytes[i];
    for (int bit = 0; bit < 8; ++bit) crc = (crc >> 1) ^ (kCrc32Polynomial & (0u - (crc & 1)));
  }
  return ~crc;
}

// ---- Setters that keep the absent-values rule in one place

void SetText(PropertyBag* bag, uint16_t id, const std::string& text) {
  if (!text.empty()) bag->Set(id, PropertyValue::Unicode(ToValidUtf8(text)));
}
void SetTextIfAbsent(PropertyBag* bag, uint16_t id, const std::string& text) {
  if (!bag->Find(id)) SetText(bag, id, text);
}
void SetInt(PropertyBag* bag, uint16_t id, uint32_t value) {
  if (value != 0) bag->Set(id, PropertyValue::Int32(int32_t(value)));
}
void SetFlag(PropertyBag* bag, uint16_t id, uint32_t value) {
  if (value != 0) bag->Set(id, PropertyValue::Boolean(true));
}
void SetTime(PropertyBag* bag, uint16_t id, const store::FileTime& t) {
  if (t) bag->Set(id, PropertyValue::SysTime(*t));
}
void SetNamedTime(PropertyBag* bag, const Guid& set, uint32_t lid, const store::FileTime& t) {
  if (t) bag->SetNamed(NamedId(set, lid), PropertyValue::SysTime(*t));
}
void SetBinary(PropertyBag* bag, uint16_t id, const Bytes& bytes) {
  if (!bytes.empty()) bag->Set(id, PropertyValue::Binary(bytes));
}

// The boolean "B2" is kept as +1 (true), -1 (false) and 0 (absent).
void SetTriState(PropertyBag* bag, uint16_t id, int32_t value) {
  if (value != 0) bag->Set(id, PropertyValue::Boolean(value > 0));
}

// ---- Fields every class has

void FillRow(const store::MessageSummary& row, PropertyBag* bag) {
  if (!bag->Find(kPidSubject) && !row.subject.empty()) {
    bag->Set(kPidSubject, PropertyValue::Unicode(ToValidUtf8(row.subject)));
    bag->Set(kPidNormalizedSubject, PropertyValue::Unicode(ToValidUtf8(row.subject)));
  }
  SetInt(bag, kPidImportance, row.importance);
  if (std::optional<uint64_t> t = FileTimeFromDateText(row.received)) {
    bag->Set(kPidMessageDeliveryTime, PropertyValue::SysTime(*t));
  }
  if (!bag->Find(kPidCreationTime))
    SetTime(bag, kPidCreationTime, FileTimeFromDateText(row.created));
  SetTime(bag, kPidLastModificationTime, FileTimeFromDateText(row.modified));
  if (std::optional<int32_t> flags = MessageFlagsFromText(row.flags_text)) {
    const int32_t kept = bag->Int32(kPidMessageFlags).value_or(0) & kMsgFlagHasAttach;
    bag->Set(kPidMessageFlags, PropertyValue::Int32(kept | *flags));
  }
  if (!row.sender.empty() && !bag->Find(kPidSentRepresentingName)) {
    SetText(bag, kPidSentRepresentingName, row.sender);
    SetTextIfAbsent(bag, kPidSenderName, row.sender);
  }
  // The composed file's lines are the row's own, but an empty one was left out there.
  if (bag->String(kPidDisplayTo).value_or("").empty()) SetText(bag, kPidDisplayTo, row.to);
  if (bag->String(kPidDisplayCc).value_or("").empty()) SetText(bag, kPidDisplayCc, row.cc);
}

void FillMessageRecord(const store::MessageRecord& r, PropertyBag* bag) {
  SetInt(bag, kPidSensitivity, r.sensitivity);
  // The imported HTML names its own code page; the record's serves when it did not.
  if (!bag->Find(kPidInternetCodepage)) SetInt(bag, kPidInternetCodepage, r.internet_code_page);
  SetTime(bag, kPidCreationTime, r.creation_time);
  SetFlag(bag, kPidResponseRequested, r.response_requested);
  SetFlag(bag, kPidRecipientReassignmentProhibited, r.reassignment_prohibited);
  SetTriState(bag, kPidAlternateRecipientAllowed, r.b2);
  SetFlag(bag, kPidOriginatorDeliveryReportRequested, r.b23);
  SetFlag(bag, kPidReadReceiptRequested, r.b29);
  SetFlag(bag, kPidConversationIndexTracking, r.b3016);
  // The headers the message arrived with, not those of the file composed for the import.
  SetText(bag, kPidTransportMessageHeaders, r.transport_headers);
  SetText(bag, kPidInReplyToId, r.in_reply_to);
  SetText(bag, kPidReplyRecipientNames, r.reply_recipient_names);
  SetText(bag, kPidOriginalMessageId, r.s1046);
  SetBinary(bag, kPidConversationIndex, r.conversation_index);
  if (auto it = r.strings.find("S70"); it != r.strings.end()) {
    SetText(bag, kPidConversationTopic, it->second);
  }
  // A plain-text body does not travel in the composed file when the item has an RTF body.
  // Nor does it when the item has an HTML body: the text then stays among
  // the record's other strings.
  if (!bag->Find(kPidBody)) {
    if (r.body_is_text) {
      SetText(bag, kPidBody, std::string(ByteView(r.body).ToString()));
    } else if (auto it = r.strings.find("S1000"); it != r.strings.end() && !it->second.empty()) {
      SetText(bag, kPidBody, it->second);
    }
  }
}

void SetClassIfAbsent(PropertyBag* bag, std::string_view item_class) {
  if (!bag->Find(kPidMessageClass)) {
    bag->Set(kPidMessageClass, PropertyValue::Unicode(std::string(item_class)));
  }
}

// Parses "Sxxxx" / "MSxxxx" into the id and whether the value is multi-valued.
bool ParseStringColumn(std::string_view column, uint16_t* id, bool* multi) {
  *multi = column.substr(0, 2) == "MS";
  std::string_view hex = column.substr(*multi ? 2 : 1);
  if ((!*multi && column.substr(0, 1) != "S") || hex.empty() || hex.size() > 4) return false;
  uint32_t v = 0;
  for (char c : hex) {
    const char lower = char(c | 0x20);
    const int d = c >= '0' && c <= '9'           ? c - '0'
                  : lower >= 'a' && lower <= 'f' ? lower - 'a' + 10
                                                 : -1;
    if (d < 0) return false;
    v = v << 4 | uint32_t(d);
  }
  *id = uint16_t(v);
  return true;
}

std::vector<std::string> SplitList(const std::string& text) {
  std::vector<std::string> out;
  size_t start = 0;
  while (start <= text.size()) {
    const size_t end = std::min(text.find(';', start), text.size());
    if (end > start) out.push_back(text.substr(start, end - start));
    start = end + 1;
  }
  return out;
}

// The same calendar date at midnight UTC: the "local" form of a contact's dates.
store::FileTime LocalDateForm(const store::FileTime& t) {
  if (!t) return std::nullopt;
  std::optional<std::tm> local = FileTimeToTm(*t, Zone::kLocal);
  if (!local) return std::nullopt;
  local->tm_hour = local->tm_min = local->tm_sec = 0;
  return UnixTimeToFileTime(timegm(&*local));
}

}  // namespace

FillerKind FillerKindFor(std::string_view c) {
  if (c == "IPM.Contact" || c == "IPF.Contact") return FillerKind::kContact;
  if (c == "IPM.Appointment" || c == "IPF.Appointment" || c == "IPM.Appointment.Private Calendar" ||
      c == "IPM.Schedule.Meeting.Request") {
    return FillerKind::kAppointment;
  }
  if (c == "IPM.Task" || c == "IPF.Task") return FillerKind::kTask;
  if (c == "IPM.DistList" || c == "IPF.DistList") return FillerKind::kDistributionList;
  if (c == "IPM.Activity" || c == "IPF.Activity") return FillerKind::kJournal;
  if (c == "IPM.StickyNote" || c == "IPF.StickyNote") return FillerKind::kStickyNote;
  return FillerKind::kMail;
}

std::optional<int32_t> MessageFlagsFromText(std::string_view text) {
  if (text.empty()) return std::nullopt;
  int32_t flags = 0;
  size_t start = 0;
  while (start < text.size()) {
    const size_t end = std::min(text.find(',', start), text.size());
    const std::string_view word = text.substr(start, end - start);
    for (const FlagWord& f : kFlagWords) {
      if (word == f.word) flags |= f.bit;
    }
    start = end + 1;
  }
  if (text == kUnread) flags &= ~kMsgFlagRead;
  return flags;
}

std::vector<Bytes> MemberEntryIds(const std::vector<store::ListMember>& members) {
  std::vector<Bytes> out;
  out.reserve(members.size());
  for (const store::ListMember& m : members) {
    const std::string type = m.address_type.empty() ? std::string(kSmtp) : m.address_type;
    const std::string& name = m.display_name.empty() ? m.email_address : m.display_name;
    out.push_back(
        OneOffEntryId(ToValidUtf8(name), ToValidUtf8(type), ToValidUtf8(m.email_address)));
  }
  return out;
}

void FillMail(const store::MessageRecord& record, const store::MessageSummary& row, Message* out) {
  FillRow(row, &out->properties);
  FillMessageRecord(record, &out->properties);
}

void FillStickyNote(const store::MessageRecord& record, const store::MessageSummary& row,
                    Message* out) {
  PropertyBag& bag = out->properties;
  SetClassIfAbsent(&bag, "IPM.StickyNote");
  FillRow(row, &bag);
  FillMessageRecord(record, &bag);
  // Colour 0 is blue, so presence, not a non-zero value, decides here.
  for (const NamedColumn& c : kNoteValues) {
    if (auto it = record.named_values.find(std::string(c.column));
        it != record.named_values.end()) {
      bag.SetNamed(NamedId(kPsetidNote, c.lid), PropertyValue::Int32(int32_t(it->second)));
    }
  }
}

void FillJournal(const store::MessageRecord& record, const store::MessageSummary& row,
                 Message* out) {
  PropertyBag& bag = out->properties;
  SetClassIfAbsent(&bag, "IPM.Activity");
  FillRow(row, &bag);
  FillMessageRecord(record, &bag);
  for (const NamedColumn& c : kLogStrings) {
    if (auto it = record.strings.find(std::string(c.column));
        it != record.strings.end() && !it->second.empty()) {
      bag.SetNamed(NamedId(kPsetidLog, c.lid), PropertyValue::Unicode(ToValidUtf8(it->second)));
    }
  }
  for (const NamedColumn& c : kLogValues) {
    if (auto it = record.named_values.find(std::string(c.column));
        it != record.named_values.end() && it->second != 0) {
      bag.SetNamed(NamedId(kPsetidLog, c.lid), PropertyValue::Int32(int32_t(it->second)));
    }
  }
}

void FillDistributionList(const store::MessageRecord& record, const store::MessageSummary& row,
                          Message* out) {
  PropertyBag& bag = out->properties;
  SetClassIfAbsent(&bag, "IPM.DistList");
  FillRow(row, &bag);
  FillMessageRecord(record, &bag);
  const std::string name = ToValidUtf8(row.subject);
  if (!name.empty()) {
    bag.SetNamed(NamedId(kPsetidAddress, kLidDistributionListName), PropertyValue::Unicode(name));
    bag.SetNamed(NamedId(kPsetidAddress, kLidFileUnder), PropertyValue::Unicode(name));
    bag.Set(kPidDisplayName, PropertyValue::Unicode(name));
  }
  if (record.members.empty()) return;
  std::vector<Bytes> ids = MemberEntryIds(record.members);
  uint32_t checksum = 0;
  for (const Bytes& id : ids) checksum = Crc32(checksum, ByteView(id));
  // Every member is a one-off: both lists hold the same identifiers.
  bag.SetNamed(NamedId(kPsetidAddress, kLidDistributionListOneOffMembers),
               PropertyValue::MultiBinary(ids));
  bag.SetNamed(NamedId(kPsetidAddress, kLidDistributionListMembers),
               PropertyValue::MultiBinary(std::move(ids)));
  bag.SetNamed(NamedId(kPsetidAddress, kLidDistributionListChecksum),
               PropertyValue::Int32(int32_t(checksum)));
}

void FillTask(const store::TaskRecord& r, const store::MessageSummary& row, Message* out) {
  PropertyBag& bag = out->properties;
  SetClassIfAbsent(&bag, "IPM.Task");
  FillRow(row, &bag);
  const store::FileTime& start = r.times[0];
  const store::FileTime& due = r.times[1];
  SetNamedTime(&bag, kPsetidTask, kLidTaskStartDate, start);
  SetNamedTime(&bag, kPsetidCommon, kLidCommonStart, start);
  SetNamedTime(&bag, kPsetidTask, kLidTaskDueDate, due);
  SetNamedTime(&bag, kPsetidCommon, kLidCommonEnd, due);
  SetTime(&bag, kPidDeferredDeliveryTime, r.times[3]);
  SetTime(&bag, kPidDeferredSendTime, r.times[4]);
  SetTime(&bag, kPidClientSubmitTime, r.time_7);
  if (r.percent_complete > 0) {
    const double percent = std::min(r.percent_complete, 1.0);
    const bool complete = percent >= 1.0;
    bag.SetNamed(NamedId(kPsetidTask, kLidPercentComplete), PropertyValue::Double(percent));
    bag.SetNamed(NamedId(kPsetidTask, kLidTaskStatus),
                 PropertyValue::Int32(complete ? kTaskStatusComplete : kTaskStatusInProgress));
    bag.SetNamed(NamedId(kPsetidTask, kLidTaskComplete), PropertyValue::Boolean(complete));
  }
  SetInt(&bag, kPidSensitivity, r.sensitivity);
  SetInt(&bag, kPidPriority, r.priority);
  if (!bag.Find(kPidInternetCodepage)) SetInt(&bag, kPidInternetCodepage, r.internet_code_page);
  SetFlag(&bag, kPidResponseRequested, r.response_requested);
  SetFlag(&bag, kPidRecipientReassignmentProhibited, r.reassignment_prohibited);
  SetBinary(&bag, kPidConversationIndex, r.conversation_index);
  SetTextIfAbsent(&bag, kPidBody, r.body_text);
}

void FillAppointment(const store::AppointmentRecord& r, const store::MessageSummary& row,
                     Message* out) {
  PropertyBag& bag = out->properties;
  SetClassIfAbsent(&bag, "IPM.Appointment");
  FillRow(row, &bag);
  // As in the calendar file: without its own time the second date field stands in.
  const store::FileTime start = r.start_time ? r.start_time : r.named_time_2;
  const store::FileTime end = r.end_time ? r.end_time : r.named_time_2;
  SetNamedTime(&bag, kPsetidAppointment, kLidAppointmentStartWhole, start);
  SetNamedTime(&bag, kPsetidCommon, kLidCommonStart, start);
  SetTime(&bag, kPidStartDate, start);
  SetNamedTime(&bag, kPsetidAppointment, kLidAppointmentEndWhole, end);
  SetNamedTime(&bag, kPsetidCommon, kLidCommonEnd, end);
  SetTime(&bag, kPidEndDate, end);
  if (start && end && *end >= *start) {
    const uint64_t minutes = (*end - *start) / kTicksPerMinute;
    bag.SetNamed(NamedId(kPsetidAppointment, kLidAppointmentDuration),
                 PropertyValue::Int32(int32_t(std::min<uint64_t>(minutes, INT32_MAX))));
  }
  if (r.value_present) {
    bag.SetNamed(NamedId(kPsetidAppointment, kLidBusyStatus),
                 PropertyValue::Int32(int32_t(r.value)));
  }
  SetTime(&bag, kPidCreationTime, r.creation_time);
  SetInt(&bag, kPidSensitivity, r.sensitivity);
  SetFlag(&bag, kPidResponseRequested, r.response_requested);
  SetFlag(&bag, kPidRecipientReassignmentProhibited, r.reassignment_prohibited);
  SetTriState(&bag, kPidAlternateRecipientAllowed, r.b2);
  SetBinary(&bag, kPidConversationIndex, r.conversation_index);
  SetTextIfAbsent(&bag, kPidBody, r.body_text);
}

void FillContact(const store::ContactRecord& r, const store::MessageSummary& row, Message* out) {
  PropertyBag& bag = out->properties;
  SetClassIfAbsent(&bag, "IPM.Contact");
  FillRow(row, &bag);
  for (const auto& [column, value] : r.strings) {
    uint16_t id;
    bool multi;
    if (value.empty() || !ParseStringColumn(column, &id, &multi)) continue;
    const std::string text = ToValidUtf8(value);
    if (id < 0x8000) {
      bag.Set(id,
              multi ? PropertyValue::MultiUnicode(SplitList(text)) : PropertyValue::Unicode(text));
    } else if (!multi && std::find(std::begin(kContactNamedStrings), std::end(kContactNamedStrings),
                                   id) != std::end(kContactNamedStrings)) {
      bag.SetNamed(NamedId(kPsetidAddress, id), PropertyValue::Unicode(text));
    }
  }
  SetTime(&bag, kPidBirthday, r.birthday);
  SetNamedTime(&bag, kPsetidAddress, kLidBirthdayLocal, LocalDateForm(r.birthday));
  SetTime(&bag, kPidWeddingAnniversary, r.anniversary);
  SetNamedTime(&bag, kPsetidAddress, kLidWeddingAnniversaryLocal, LocalDateForm(r.anniversary));
  if (r.gender != 0) bag.Set(kPidGender, PropertyValue::Int16(int16_t(r.gender)));
  SetFlag(&bag, kPidResponseRequested, r.response_requested);
  SetFlag(&bag, kPidRecipientReassignmentProhibited, r.reassignment_prohibited);
  SetBinary(&bag, kPidConversationIndex, r.conversation_index);
  // An e-mail address without its type is an Internet one.
  for (uint32_t slot = 0; slot < 3; ++slot) {
    const uint32_t stride = kLidEmailStride * slot;
    if (bag.FindNamed(NamedId(kPsetidAddress, kLidEmail1EmailAddress + stride)) &&
        !bag.FindNamed(NamedId(kPsetidAddress, kLidEmail1AddressType + stride))) {
      bag.SetNamed(NamedId(kPsetidAddress, kLidEmail1AddressType + stride),
                   PropertyValue::Unicode(std::string(kSmtp)));
    }
  }
  if (const std::optional<std::string> subject = bag.String(kPidSubject)) {
    SetTextIfAbsent(&bag, kPidDisplayName, *subject);
    if (!bag.FindNamed(NamedId(kPsetidAddress, kLidFileUnder))) {
      bag.SetNamed(NamedId(kPsetidAddress, kLidFileUnder), PropertyValue::Unicode(*subject));
    }
  }
}

void FillFromRecords(const store::ItemRecords& records, const store::MessageSummary& row,
                     const std::string& message_class, Message* out) {
  const FillerKind kind = FillerKindFor(message_class);
  std::string item_class = message_class.empty() ? "IPM.Note" : message_class;
  if (item_class.rfind("IPF.", 0) == 0) {
    for (const CanonicalClass& c : kCanonicalClasses) {
      if (c.kind == kind) item_class = c.item_class;
    }
  }
  out->properties.Set(kPidMessageClass, PropertyValue::Unicode(item_class));
  switch (kind) {
    case FillerKind::kMail:
      return FillMail(records.message, row, out);
    case FillerKind::kStickyNote:
      return FillStickyNote(records.message, row, out);
    case FillerKind::kJournal:
      return FillJournal(records.message, row, out);
    case FillerKind::kTask:
      return FillTask(records.task, row, out);
    case FillerKind::kDistributionList:
      return FillDistributionList(records.message, row, out);
    case FillerKind::kAppointment:
      return FillAppointment(records.appointment, row, out);
    case FillerKind::kContact:
      return FillContact(records.contact, row, out);
  }
}

}  // namespace tarnwell::mapi
