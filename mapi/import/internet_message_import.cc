#include "mapi/import/internet_message_import.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <vector>

#include "base/date_time.h"
#include "base/text.h"
#include "mapi/property_tags.h"
#include "render/mime/mime_encoded_word.h"
#include "render/mime/mime_message.h"
#include "render/mime/mime_parser.h"
#include "store/rtf_decompressor.h"

namespace tarnwell::mapi {
namespace {

using render::CMimeBody;
using render::CMimeMessage;

constexpr std::string_view kSmtp = "SMTP";
constexpr std::string_view kDefaultMessageClass = "IPM.Note";
constexpr std::string_view kDisplaySeparator = "; ";
constexpr int32_t kRenderingPositionNone = -1;
constexpr size_t kMaxRecipients = 10000;
constexpr size_t kMaxSubjectPrefixChars = 3;
constexpr int32_t kPriorityUrgent = 1;
constexpr int32_t kPriorityNonUrgent = -1;

// ---- Small text helpers

bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }

std::string_view Trim(std::string_view s) {
  while (!s.empty() && IsBlank(s.front())) s.remove_prefix(1);
  while (!s.empty() && IsBlank(s.back())) s.remove_suffix(1);
  return s;
}

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

std::string ToText(ByteView bytes) {
  return std::string(reinterpret_cast<const char*>(bytes.data()), bytes.size());
}

// ---- Dates (RFC 5322 section 3.3, with the obsolete forms of section 4.3)

constexpr std::string_view kMonthNames[] = {"jan", "feb", "mar", "apr", "may", "jun",
                                            "jul", "aug", "sep", "oct", "nov", "dec"};
constexpr int kSecondsPerMinute = 60;
constexpr int kSecondsPerHour = 3600;
constexpr int64_t kSecondsPerDay = 86400;
constexpr int kTwoDigitYearPivot = 50;  // 49 is 2049, 50 is 1950

struct ZoneName {
  std::string_view name;
  int hours;
};
constexpr ZoneName kZoneNames[] = {{"ut", 0},   {"gmt", 0},  {"z", 0},    {"est", -5},
                                   {"edt", -4}, {"cst", -6}, {"cdt", -5}, {"mst", -7},
                                   {"mdt", -6}, {"pst", -8}, {"pdt", -7}};

// Days from 1970-01-01 to the given proleptic Gregorian date.
int64_t DaysFromCivil(int64_t year, int month, int day) {
  // Counting years from March puts the leap day at the end of the year.
  if (month <= 2) --year;
  const int64_t era = (year >= 0 ? year : year - 399) / 400;
  const int64_t year_of_era = year - era * 400;
  const int64_t shifted_month = month > 2 ? month - 3 : month + 9;
  const int64_t day_of_year = (153 * shifted_month + 2) / 5 + day - 1;
  const int64_t day_of_era = year_of_era * 365 + year_of_era / 4 - year_of_era / 100 + day_of_year;
  constexpr int64_t kDaysFrom0000To1970 = 719468;
  return era * 146097 + day_of_era - kDaysFrom0000To1970;
}

int DaysInMonth(int year, int month) {
  static constexpr int kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  const bool leap = (year % 4 == 0 && year % 100 != 0) || year % 400 == 0;
  return month == 2 && leap ? 29 : kDays[month - 1];
}

// Splits a date into words at blanks and commas, with comments removed.
std::vector<std::string> DateWords(std::string_view text) {
  std::vector<std::string> words;
  std::string word;
  int comment = 0;
  for (char c : text) {
    if (c == '(') {
      ++comment;
    } else if (c == ')' && comment > 0) {
      --comment;
    } else if (comment == 0 && !IsBlank(c) && c != ',') {
      word.push_back(c);
      continue;
    }
    if (!word.empty()) words.push_back(std::move(word));
    word.clear();
  }
  if (!word.empty()) words.push_back(std::move(word));
  return words;
}

bool ParseNumber(std::string_view s, size_t max_digits, int* out) {
  if (s.empty() || s.size() > max_digits) return false;
  int v = 0;
  for (char c : s) {
    if (!IsDigit(c)) return false;
    v = v * 10 + (c - '0');
  }
  *out = v;
  return true;
}

// "hh:mm" or "hh:mm:ss".
bool ParseClock(std::string_view s, int* h, int* m, int* sec) {
  const size_t c1 = s.find(':');
  if (c1 == std::string_view::npos) return false;
  const size_t c2 = s.find(':', c1 + 1);
  *sec = 0;
  if (!ParseNumber(s.substr(0, c1), 2, h)) return false;
  if (c2 == std::string_view::npos) return ParseNumber(s.substr(c1 + 1), 2, m);
  return ParseNumber(s.substr(c1 + 1, c2 - c1 - 1), 2, m) && ParseNumber(s.substr(c2 + 1), 2, sec);
}

// Offset east of UTC in seconds; unknown zones count as UTC, as RFC 5322 asks.
int ParseZone(std::string_view s) {
  if (s.size() == 5 && (s[0] == '+' || s[0] == '-')) {
    int hhmm;
    if (ParseNumber(s.substr(1), 4, &hhmm)) {
      const int offset = (hhmm / 100) * kSecondsPerHour + (hhmm % 100) * kSecondsPerMinute;
      return s[0] == '-' ? -offset : offset;
    }
  }
  const std::string lower = AsciiLower(s);
  for (const ZoneName& z : kZoneNames) {
    if (lower == z.name) return z.hours * kSecondsPerHour;
  }
  return 0;
}

// ---- Addresses (RFC 5322 section 3.4)

struct Mailbox {
  std::string name;
  std::string address;
};

std::string CollapseBlanks(std::string_view s) {
  std::string out;
  bool blank = false;
  for (char c : Trim(s)) {
    if (IsBlank(c)) {
      blank = true;
      continue;
    }
    if (blank && !out.empty()) out.push_back(' ');
    blank = false;
    out.push_back(c);
  }
  return out;
}

class AddressListParser {
 public:
  std::vector<Mailbox> Parse(std::string_view text) {
    for (size_t i = 0; i < text.size() && list_.size() < kMaxRecipients; ++i) {
      const char c = text[i];
      if (in_quote_) {
        if (c == '\\' && i + 1 < text.size()) {
          Current().push_back(text[++i]);
        } else if (c == '"') {
          in_quote_ = false;
        } else {
          Current().push_back(c);
        }
      } else if (comment_depth_ > 0) {
        if (c == '\\' && i + 1 < text.size()) {
          comment_.push_back(text[++i]);
        } else if (c == '(') {
          ++comment_depth_;
          comment_.push_back(c);
        } else if (c == ')') {
          if (--comment_depth_ > 0) comment_.push_back(c);
        } else {
          comment_.push_back(c);
        }
      } else if (in_angle_) {
        if (c == '>') {
          in_angle_ = false;
        } else if (c == '"') {
          in_quote_ = true;
        } else if (!IsBlank(c)) {
          angle_.push_back(c);
        }
      } else if (c == '"') {
        in_quote_ = true;
      } else if (c == '(') {
        ++comment_depth_;
        if (!comment_.empty()) comment_.push_back(' ');
      } else if (c == '<') {
        in_angle_ = true;
        has_angle_ = true;
        angle_.clear();
      } else if (c == ',') {
        Finish();
      } else if (c == ':' && !has_angle_) {
        // A group: what came before is its name, not a mailbox.
        display_.clear();
        comment_.clear();
      } else if (c == ';') {
        Finish();
      } else {
        display_.push_back(c);
      }
    }
    Finish();
    return std::move(list_);
  }

 private:
  std::string& Current() { return in_angle_ ? angle_ : display_; }

  void Finish() {
    Mailbox m;
    if (has_angle_) {
      m.address = std::string(Trim(angle_));
      m.name = CollapseBlanks(display_);
      if (m.name.empty()) m.name = CollapseBlanks(comment_);
    } else {
      std::string bare;
      for (char c : display_) {
        if (!IsBlank(c)) bare.push_back(c);
      }
      m.address = std::move(bare);
      m.name = CollapseBlanks(comment_);
    }
    // A route ("@a,@b:user@host") keeps only the mailbox.
    if (const size_t colon = m.address.rfind(':');
        colon != std::string::npos && !m.address.empty() && m.address[0] == '@') {
      m.address.erase(0, colon + 1);
    }
    if ((!m.address.empty() || !m.name.empty()) && list_.size() < kMaxRecipients) {
      list_.push_back(std::move(m));
    }
    display_.clear();
    angle_.clear();
    comment_.clear();
    has_angle_ = in_angle_ = in_quote_ = false;
    comment_depth_ = 0;
  }

  std::vector<Mailbox> list_;
  std::string display_, angle_, comment_;
  bool in_quote_ = false, in_angle_ = false, has_angle_ = false;
  int comment_depth_ = 0;
};

// A list with no address at all (and no group) is a list of display names
// as Exchange shows them: separated by semicolons, while a comma belongs to a name
// ("Müller, Jürgen").
std::vector<Mailbox> ParseAddressList(const std::string* value) {
  if (!value) return {};
  if (value->find_first_of("@<:") == std::string::npos) {
    // Quotes only protect the specials inside a name; they are not part of it.
    std::string text;
    for (size_t i = 0; i < value->size(); ++i) {
      if ((*value)[i] == '\\' && i + 1 < value->size()) {
        text.push_back((*value)[++i]);
      } else if ((*value)[i] != '"') {
        text.push_back((*value)[i]);
      }
    }
    std::vector<Mailbox> names;
    size_t at = 0;
    while (at <= text.size() && names.size() < kMaxRecipients) {
      size_t end = text.find(';', at);
      if (end == std::string::npos) end = text.size();
      std::string name = CollapseBlanks(std::string_view(text).substr(at, end - at));
      if (!name.empty()) names.push_back({std::move(name), ""});
      at = end + 1;
    }
    return names;
  }
  return AddressListParser().Parse(*value);
}

std::string NameOrAddress(const Mailbox& m) { return m.name.empty() ? m.address : m.name; }

// ---- Subject

// A prefix is one to three characters, none a blank or a digit, then ": ".
size_t SubjectPrefixLength(std::string_view subject) {
  size_t pos = 0;
  for (size_t chars = 0; chars <= kMaxSubjectPrefixChars && pos < subject.size(); ++chars) {
    const char c = subject[pos];
    if (c == ':') {
      if (chars == 0 || pos + 1 >= subject.size() || subject[pos + 1] != ' ') return 0;
      return pos + 2;
    }
    if (IsBlank(c) || IsDigit(c)) return 0;
    DecodeUtf8(subject, &pos);
  }
  return 0;
}

void SetSubject(const std::string& subject, PropertyBag* bag) {
  const size_t prefix = SubjectPrefixLength(subject);
  bag->Set(kPidSubject, PropertyValue::Unicode(subject));
  bag->Set(kPidSubjectPrefix, PropertyValue::Unicode(subject.substr(0, prefix)));
  bag->Set(kPidNormalizedSubject, PropertyValue::Unicode(subject.substr(prefix)));
  bag->Set(kPidConversationTopic, PropertyValue::Unicode(subject.substr(prefix)));
}

// ---- Importance

// X-Priority "1 (Highest)" .. "5 (Lowest)"; Importance "high" / "normal" / "low".
std::optional<int32_t> ImportanceOf(const CMimeMessage& m) {
  if (const std::string* x = m.GetFieldValue("X-Priority")) {
    const std::string_view v = Trim(*x);
    if (!v.empty() && v[0] >= '1' && v[0] <= '5') {
      return v[0] <= '2' ? kImportanceHigh : v[0] == '3' ? kImportanceNormal : kImportanceLow;
    }
  }
  for (const char* name : {"Importance", "X-MSMail-Priority"}) {
    if (const std::string* v = m.GetFieldValue(name)) {
      const std::string lower = AsciiLower(Trim(*v));
      if (lower == "high") return kImportanceHigh;
      if (lower == "normal" || lower == "medium") return kImportanceNormal;
      if (lower == "low") return kImportanceLow;
    }
  }
  return std::nullopt;
}

std::optional<int32_t> PriorityOf(const CMimeMessage& m) {
  const std::string* v = m.GetFieldValue("Priority");
  if (!v) return std::nullopt;
  const std::string lower = AsciiLower(Trim(*v));
  if (lower == "urgent") return kPriorityUrgent;
  if (lower == "non-urgent") return kPriorityNonUrgent;
  if (lower == "normal") return 0;
  return std::nullopt;
}

// ---- Attachments

// The 8.3 form of a file name, for programs that still read PidTagAttachFilename.
std::string ShortFileName(std::string_view name) {
  constexpr size_t kStemChars = 8, kExtensionChars = 3, kCutStem = 6;
  const size_t dot = name.rfind('.');
  std::string_view stem = dot == std::string_view::npos ? name : name.substr(0, dot);
  std::string_view ext = dot == std::string_view::npos ? "" : name.substr(dot + 1);
  auto clean = [](std::string_view s) {
    std::string out;
    for (char c : s) {
      if ((c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || IsDigit(c) || c == '_' || c == '-') {
        out.push_back(c >= 'a' && c <= 'z' ? char(c - 'a' + 'A') : c);
      }
    }
    return out;
  };
  std::string s = clean(stem), e = clean(ext).substr(0, kExtensionChars);
  if (s.empty()) s = "ATTACH";
  if (s.size() > kStemChars || s.size() != stem.size()) s = s.substr(0, kCutStem) + "~1";
  return e.empty() ? s : s + "." + e;
}

std::string Extension(std::string_view name) {
  constexpr size_t kMaxExtension = 16;
  const size_t dot = name.rfind('.');
  if (dot == std::string_view::npos || dot + 1 == name.size()) return {};
  std::string_view ext = name.substr(dot);
  if (ext.size() > kMaxExtension || ext.find_first_of("/\\ ") != std::string_view::npos) return {};
  return std::string(ext);
}

std::string StripAngles(std::string_view id) {
  id = Trim(id);
  if (id.size() >= 2 && id.front() == '<' && id.back() == '>') id = id.substr(1, id.size() - 2);
  return std::string(id);
}

void SetFileNames(const std::string& name, PropertyBag* bag) {
  if (name.empty()) return;
  bag->Set(kPidDisplayName, PropertyValue::Unicode(name));
  bag->Set(kPidAttachLongFilename, PropertyValue::Unicode(name));
  bag->Set(kPidAttachFilename, PropertyValue::Unicode(ShortFileName(name)));
  if (std::string ext = Extension(name); !ext.empty()) {
    bag->Set(kPidAttachExtension, PropertyValue::Unicode(ext));
  }
}

// ---- RTF compression: the format is described in store/rtf_decompressor.h.

constexpr size_t kRtfMinMatch = 2;
constexpr size_t kRtfMaxMatch = 17;  // 4 length bits hold length - 2
constexpr size_t kRtfMaxChain = 64;
constexpr size_t kRtfTokensPerRun = 8;
constexpr uint32_t kRtfOffsetShift = 4;
constexpr uint32_t kRtfDictionaryMask = store::kRtfDictionarySize - 1;

class RtfCompressor {
 public:
  RtfCompressor() {
    head_.fill(kNone);
    prev_.fill(kNone);
    for (char c : store::kRtfPrebuffer) Put(uint8_t(c));
  }

  Bytes Compress(ByteView in) {
    Bytes stream;
    size_t control_at = 0, tokens = kRtfTokensPerRun;
    auto start_token = [&](bool reference) {
      if (tokens == kRtfTokensPerRun) {
        control_at = stream.size();
        stream.push_back(0);
        tokens = 0;
      }
      if (reference) stream[control_at] |= uint8_t(1u << tokens);
      ++tokens;
    };
    size_t i = 0;
    while (i < in.size()) {
      size_t offset = 0;
      const size_t length = LongestMatch(in, i, &offset);
      if (length >= kRtfMinMatch) {
        start_token(true);
        const uint32_t token =
            uint32_t(offset) << kRtfOffsetShift | uint32_t(length - kRtfMinMatch);
        stream.push_back(uint8_t(token >> 8));
        stream.push_back(uint8_t(token));
        for (size_t k = 0; k < length; ++k) Put(in[i + k]);
        i += length;
      } else {
        start_token(false);
        stream.push_back(in[i]);
        Put(in[i]);
        ++i;
      }
    }
    // The end: a reference to the write position itself.
    start_token(true);
    const uint32_t end = uint32_t(write_) << kRtfOffsetShift;
    stream.push_back(uint8_t(end >> 8));
    stream.push_back(uint8_t(end));

    Bytes out(store::kRtfHeaderSize);
    constexpr size_t kSizeFieldWidth = 4;
    StoreU32LE(out.data(), uint32_t(store::kRtfHeaderSize - kSizeFieldWidth + stream.size()));
    StoreU32LE(out.data() + 4, uint32_t(in.size()));
    StoreU32LE(out.data() + 8, store::kRtfCompressed);
    StoreU32LE(out.data() + 12, store::RtfCrc32(ByteView(stream)));
    out.insert(out.end(), stream.begin(), stream.end());
    return out;
  }

 private:
  static constexpr int16_t kNone = -1;
  static constexpr size_t kKeys = 1 << 16;

  void Put(uint8_t b) {
    dict_[write_] = b;
    if (filled_ > 0) {
      const uint32_t p = (write_ - 1) & kRtfDictionaryMask;
      const uint32_t key = uint32_t(dict_[p]) << 8 | b;
      prev_[p] = head_[key];
      head_[key] = int16_t(p);
    }
    write_ = (write_ + 1) & kRtfDictionaryMask;
    if (filled_ < store::kRtfDictionarySize) ++filled_;
  }

  // The longest dictionary run equal to in[i..]; only runs that end before
  // the write position, so that copying them never reads what it writes.
  size_t LongestMatch(ByteView in, size_t i, size_t* offset) const {
    if (i + 1 >= in.size()) return 0;
    const size_t limit = std::min(kRtfMaxMatch, in.size() - i);
    const uint32_t key = uint32_t(in[i]) << 8 | in[i + 1];
    size_t best = 0;
    int16_t s = head_[key];
    for (size_t chain = 0; s != kNone && chain < kRtfMaxChain; ++chain, s = prev_[size_t(s)]) {
      const uint32_t distance = (write_ - uint32_t(s)) & kRtfDictionaryMask;
      size_t len = 0;
      while (len < limit && len < distance &&
             dict_[(uint32_t(s) + len) & kRtfDictionaryMask] == in[i + len]) {
        ++len;
      }
      if (len > best) {
        best = len;
        *offset = size_t(s);
        if (best == limit) break;
      }
    }
    return best;
  }

  std::array<uint8_t, store::kRtfDictionarySize> dict_{};
  std::array<int16_t, kKeys> head_;
  std::array<int16_t, store::kRtfDictionarySize> prev_;
  uint32_t write_ = 0;
  size_t filled_ = 0;
};

// ---- The part walk

class Importer {
 public:
  Importer(Message* out, int depth) : out_(out), depth_(depth) {}

  Status Run(ByteView eml) {
    CMimeMessage m;
    Status s = m.Parse(eml);
    if (!s.ok()) return s;
    PropertyBag& bag = out_->properties;
    if (!bag.Find(kPidMessageClass)) {
      bag.Set(kPidMessageClass, PropertyValue::Unicode(std::string(kDefaultMessageClass)));
    }
    Headers(m, eml);
    Walk(&m, false);
    Bodies();
    int32_t flags = kMsgFlagRead;
    if (!out_->attachments.empty()) flags |= kMsgFlagHasAttach;
    bag.Set(kPidMessageFlags, PropertyValue::Int32(flags));
    return Status::Ok();
  }

 private:
  void Headers(const CMimeMessage& m, ByteView eml) {
    PropertyBag& bag = out_->properties;
    std::vector<render::RawField> raw;
    const size_t header_size = render::ParseHeaderBlock(eml, &raw);
    bag.Set(kPidTransportMessageHeaders,
            PropertyValue::Unicode(render::HeaderBytesToUtf8(ToText(eml.Sub(0, header_size)))));

    if (const std::string* subject = m.GetFieldValue("Subject")) SetSubject(*subject, &bag);

    const std::vector<Mailbox> from = ParseAddressList(m.GetFieldValue("From"));
    const std::vector<Mailbox> sender = ParseAddressList(m.GetFieldValue("Sender"));
    if (!from.empty()) {
      SetMailbox(from[0], kPidSentRepresentingName, kPidSentRepresentingAddressType,
                 kPidSentRepresentingEmailAddress, kPidSentRepresentingSmtpAddress);
    }
    if (const Mailbox* s = !sender.empty() ? &sender[0] : !from.empty() ? &from[0] : nullptr) {
      SetMailbox(*s, kPidSenderName, kPidSenderAddressType, kPidSenderEmailAddress,
                 kPidSenderSmtpAddress);
    }

    const std::pair<const char*, int32_t> kinds[] = {
        {"To", kRecipientTo}, {"Cc", kRecipientCc}, {"Bcc", kRecipientBcc}};
    const uint16_t display_ids[] = {kPidDisplayTo, kPidDisplayCc, kPidDisplayBcc};
    for (size_t k = 0; k < std::size(kinds); ++k) {
      std::string display;
      for (const Mailbox& mb : ParseAddressList(m.GetFieldValue(kinds[k].first))) {
        if (out_->recipients.size() >= kMaxRecipients) break;
        out_->recipients.push_back(SmtpRecipient(kinds[k].second, mb.name, mb.address));
        if (!display.empty()) display += kDisplaySeparator;
        display += NameOrAddress(mb);
      }
      bag.Set(display_ids[k], PropertyValue::Unicode(display));
    }
    std::string reply_names;
    for (const Mailbox& mb : ParseAddressList(m.GetFieldValue("Reply-To"))) {
      if (!reply_names.empty()) reply_names += kDisplaySeparator;
      reply_names += NameOrAddress(mb);
    }
    if (!reply_names.empty()) {
      bag.Set(kPidReplyRecipientNames, PropertyValue::Unicode(reply_names));
    }

    if (const std::string* date = m.GetFieldValue("Date")) {
      if (std::optional<uint64_t> t = ParseInternetDate(*date)) {
        bag.Set(kPidClientSubmitTime, PropertyValue::SysTime(*t));
        bag.Set(kPidMessageDeliveryTime, PropertyValue::SysTime(*t));
      }
    }
    const std::pair<const char*, uint16_t> ids[] = {{"Message-ID", kPidInternetMessageId},
                                                    {"In-Reply-To", kPidInReplyToId},
                                                    {"References", kPidInternetReferences}};
    for (const auto& [name, id] : ids) {
      if (const std::string* v = m.GetFieldValue(name); v && !Trim(*v).empty()) {
        bag.Set(id, PropertyValue::Unicode(std::string(Trim(*v))));
      }
    }
    if (std::optional<int32_t> importance = ImportanceOf(m)) {
      bag.Set(kPidImportance, PropertyValue::Int32(*importance));
    }
    if (std::optional<int32_t> priority = PriorityOf(m)) {
      bag.Set(kPidPriority, PropertyValue::Int32(*priority));
    }
  }

  void SetMailbox(const Mailbox& mb, uint16_t name_id, uint16_t type_id, uint16_t address_id,
                  uint16_t smtp_id) {
    PropertyBag& bag = out_->properties;
    bag.Set(name_id, PropertyValue::Unicode(NameOrAddress(mb)));
    if (mb.address.empty()) return;
    bag.Set(type_id, PropertyValue::Unicode(std::string(kSmtp)));
    bag.Set(address_id, PropertyValue::Unicode(mb.address));
    bag.Set(smtp_id, PropertyValue::Unicode(mb.address));
  }

  void Walk(CMimeBody* part, bool in_alternative) {
    const std::string main = part->GetMainType();
    const std::string sub = part->GetSubType();
    if (part->GetChildCount() > 0 || main == "multipart") {
      for (size_t i = 0; i < part->GetChildCount(); ++i) {
        Walk(part->GetChild(i), main == "multipart" && sub == "alternative");
      }
      return;
    }
    const std::optional<std::string> file_name = part->GetFileName();
    std::string disposition;
    if (const std::string* d = part->GetFieldValue("Content-Disposition")) {
      disposition = AsciiLower(Trim(std::string_view(*d).substr(0, d->find(';'))));
    }
    const bool named = (file_name && !file_name->empty()) || disposition == "attachment";
    if (main == "text" && (sub == "plain" || sub == "html") && !named) {
      // The composer writes an empty first part when the body is elsewhere.
      if (part->GetContentLength() == 0) return;
      if (sub == "plain") {
        if (!plain_) {
          plain_ = part->GetText();
          return;
        }
        if (in_alternative) return;  // another form of the body already taken
        plain_->append("\r\n").append(part->GetText());
        return;
      }
      if (!html_) {
        html_ = part;
        return;
      }
      if (in_alternative) return;
    }
    if (!rtf_done_ && (main == "application" || main == "text") && sub == "rtf" && file_name &&
        EqualsIgnoreAsciiCase(*file_name, kRtfBodyFileName)) {
      rtf_done_ = true;
      out_->properties.Set(kPidRtfCompressed,
                           PropertyValue::Binary(CompressRtf(part->GetContent())));
      out_->properties.Set(kPidRtfInSync, PropertyValue::Boolean(true));
      return;
    }
    if (main == "message" && sub == "rfc822" && depth_ < kMaxEmbeddedDepth) {
      auto embedded = std::make_unique<Message>();
      if (Importer(embedded.get(), depth_ + 1).Run(part->GetContent()).ok()) {
        AddEmbedded(part, file_name.value_or(""), std::move(embedded));
        return;
      }
    }
    AddByValue(part, file_name.value_or(""));
  }

  void CommonAttachmentProperties(const CMimeBody* part, Attachment* a) {
    PropertyBag& bag = a->properties;
    bag.Set(kPidAttachMimeTag,
            PropertyValue::Unicode(part->GetMainType() + "/" + part->GetSubType()));
    if (const std::string* id = part->GetFieldValue("Content-ID")) {
      if (std::string clean = StripAngles(*id); !clean.empty()) {
        bag.Set(kPidAttachContentId, PropertyValue::Unicode(clean));
      }
    }
    bag.Set(kPidRenderingPosition, PropertyValue::Int32(kRenderingPositionNone));
  }

  void AddByValue(CMimeBody* part, const std::string& name) {
    Attachment a;
    a.data = part->TakeContent();
    a.properties.Set(kPidAttachMethod, PropertyValue::Int32(kAttachByValue));
    SetFileNames(name, &a.properties);
    CommonAttachmentProperties(part, &a);
    a.properties.Set(kPidAttachSize,
                     PropertyValue::Int32(int32_t(std::min<size_t>(a.data.size(), INT32_MAX))));
    out_->attachments.push_back(std::move(a));
  }

  void AddEmbedded(CMimeBody* part, const std::string& name, std::unique_ptr<Message> embedded) {
    Attachment a;
    a.properties.Set(kPidAttachMethod, PropertyValue::Int32(kAttachEmbeddedMessage));
    std::string display = name;
    if (display.empty()) display = embedded->properties.String(kPidSubject).value_or("");
    if (!display.empty()) a.properties.Set(kPidDisplayName, PropertyValue::Unicode(display));
    CommonAttachmentProperties(part, &a);
    a.properties.Set(
        kPidAttachSize,
        PropertyValue::Int32(int32_t(std::min<size_t>(part->GetContentLength(), INT32_MAX))));
    a.embedded = std::move(embedded);
    out_->attachments.push_back(std::move(a));
  }

  void Bodies() {
    PropertyBag& bag = out_->properties;
    if (plain_) bag.Set(kPidBody, PropertyValue::Unicode(*plain_));
    if (!html_) return;
    const ByteView html = html_->GetContent();
    const std::optional<std::string> charset = html_->GetParameter("Content-Type", "charset");
    uint32_t codepage = charset ? render::CodePageForCharset(*charset) : 0;
    // Without a charset the bytes speak for themselves only when they are UTF-8; otherwise
    // the item record's code page (set by its filler) is the better guess.
    if (codepage == 0 && IsValidUtf8(ToText(html))) codepage = kCodePageUtf8;
    bag.Set(kPidHtml, PropertyValue::Binary(html.ToBytes()));
    if (codepage != 0) bag.Set(kPidInternetCodepage, PropertyValue::Int32(int32_t(codepage)));
  }

  Message* out_;
  int depth_;
  std::optional<std::string> plain_;
  const CMimeBody* html_ = nullptr;
  bool rtf_done_ = false;
};

}  // namespace

std::optional<uint64_t> ParseInternetDate(std::string_view text) {
  std::vector<std::string> words = DateWords(text);
  size_t w = 0;
  // An optional day name ("Fri").
  if (w < words.size() && !words[w].empty() && !IsDigit(words[w][0])) ++w;
  if (words.size() < w + 4) return std::nullopt;
  int day, year, hour, minute, second, month = 0;
  if (!ParseNumber(words[w], 2, &day)) return std::nullopt;
  const std::string month_name = AsciiLower(words[w + 1]).substr(0, 3);
  for (size_t i = 0; i < std::size(kMonthNames); ++i) {
    if (month_name == kMonthNames[i]) month = int(i) + 1;
  }
  if (month == 0 || !ParseNumber(words[w + 2], 4, &year)) return std::nullopt;
  if (words[w + 2].size() <= 2) year += year < kTwoDigitYearPivot ? 2000 : 1900;
  if (words[w + 2].size() == 3) year += 1900;  // obsolete: years counted from 1900
  if (!ParseClock(words[w + 3], &hour, &minute, &second)) return std::nullopt;
  if (day < 1 || day > DaysInMonth(year, month) || hour > 23 || minute > 59 || second > 60) {
    return std::nullopt;
  }
  const int zone = words.size() > w + 4 ? ParseZone(words[w + 4]) : 0;
  const int64_t seconds = DaysFromCivil(year, month, day) * kSecondsPerDay +
                          hour * kSecondsPerHour + minute * kSecondsPerMinute + second - zone;
  return UnixTimeToFileTime(seconds);
}

Bytes CompressRtf(ByteView rtf) { return RtfCompressor().Compress(rtf); }

// One-off entry identifier:
//
//   offset  width  meaning
//   0       4      flags, zero
//   4       16     provider: the one-off provider's MAPIUID
//   20      2      version, zero
//   22      2      flags: Unicode strings, no TNEF, do not look up
//   24      ...    display name, address type, address: UTF-16LE, each NUL-terminated
Bytes OneOffEntryId(std::string_view display_name, std::string_view address_type,
                    std::string_view address) {
  static constexpr uint8_t kOneOffProvider[16] = {0x81, 0x2B, 0x1F, 0xA4, 0xBE, 0xA3, 0x10, 0x19,
                                                  0x9D, 0x6E, 0x00, 0xDD, 0x01, 0x0F, 0x54, 0x02};
  constexpr uint16_t kOneOffUnicode = 0x8000;
  constexpr uint16_t kOneOffDontLookup = 0x1000;
  constexpr uint16_t kOneOffNoRichInfo = 0x0001;
  constexpr size_t kFixedSize = 24;
  Bytes out(kFixedSize);
  std::memcpy(out.data() + 4, kOneOffProvider, sizeof kOneOffProvider);
  StoreU16LE(out.data() + 22, kOneOffUnicode | kOneOffDontLookup | kOneOffNoRichInfo);
  for (std::string_view s : {display_name, address_type, address}) {
    Bytes utf16 = Utf8ToUtf16LE(s);
    out.insert(out.end(), utf16.begin(), utf16.end());
    out.push_back(0);
    out.push_back(0);
  }
  return out;
}

PropertyBag SmtpRecipient(int32_t recipient_type, std::string_view display_name,
                          std::string_view address) {
  const std::string name(display_name.empty() ? address : display_name);
  PropertyBag r;
  r.Set(kPidRecipientType, PropertyValue::Int32(recipient_type));
  r.Set(kPidDisplayName, PropertyValue::Unicode(name));
  r.Set(kPidRecipientDisplayName, PropertyValue::Unicode(name));
  r.Set(kPidAddressType, PropertyValue::Unicode(std::string(kSmtp)));
  r.Set(kPidEmailAddress, PropertyValue::Unicode(std::string(address)));
  r.Set(kPidSmtpAddress, PropertyValue::Unicode(std::string(address)));
  r.Set(kPidObjectType, PropertyValue::Int32(kObjectTypeMailUser));
  r.Set(kPidDisplayType, PropertyValue::Int32(0));
  r.Set(kPidRecipientFlags, PropertyValue::Int32(kRecipientFlagSendable));
  r.Set(kPidEntryId, PropertyValue::Binary(OneOffEntryId(name, kSmtp, address)));
  return r;
}

Status ImportInternetMessage(ByteView eml, Message* out) { return Importer(out, 0).Run(eml); }

}  // namespace tarnwell::mapi
