#include "testing/exchange/item_fixtures.h"

#include <algorithm>
#include <cstring>
#include <iterator>

namespace tarnwell::forge::exchange {
namespace {

constexpr uint64_t kTicksPerSecond = 10000000;
constexpr int64_t kSecondsFrom1601To1970 = 11644473600;
constexpr uint64_t kMinute = 60 * kTicksPerSecond;
constexpr uint64_t kHour = 60 * kMinute;
constexpr uint32_t kKeyReplica = 0x0001;
constexpr size_t kKeySize = 8;

// Folder ids whose content-table names exercise the naming rule's corners.
constexpr uint64_t kInnerZerosFolderId = 0x00010000010000B7ull;  // content name "B7"
constexpr uint64_t kNoZeroRunFolderId = 0x0001123456789123ull;   // "123456789123"
constexpr uint64_t kMissingParentId = 0x000100000000DEADull;     // no folder has it

// Message flags ("Le07").
constexpr uint32_t kFlagRead = 0x1;
constexpr uint32_t kFlagUnmodified = 0x2;
constexpr uint32_t kFlagUnsent = 0x8;
constexpr uint32_t kFlagHasAttach = 0x10;
constexpr uint32_t kFlagFromMe = 0x20;

constexpr uint32_t kImportanceLow = 0;
constexpr uint32_t kImportanceNormal = 1;
constexpr uint32_t kImportanceHigh = 2;
constexpr uint32_t kAttachByValue = 1;

// Sizes chosen to land on either side of the builder's long-value limit.
constexpr size_t kSmallAttachment = 300;
constexpr size_t kLargeAttachment = 20000;
constexpr size_t kLargeBodyChars = 6000;

int64_t DaysFromCivil(int y, unsigned m, unsigned d) {
  y -= m <= 2;
  const int64_t era = (y >= 0 ? y : y - 399) / 400;
  const unsigned yoe = unsigned(y - era * 400);
  const unsigned doy = (153 * (m + (m > 2 ? -3 : 9)) + 2) / 5 + d - 1;
  const unsigned doe = yoe * 365 + yoe / 4 - yoe / 100 + doy;
  return era * 146097 + int64_t(doe) - 719468;
}

// A UTC time as a FILETIME.
uint64_t Utc(int y, unsigned mo, unsigned d, unsigned h, unsigned mi, unsigned s = 0) {
  const int64_t unix_seconds = DaysFromCivil(y, mo, d) * 86400 + h * 3600 + mi * 60 + s;
  return uint64_t(unix_seconds + kSecondsFrom1601To1970) * kTicksPerSecond;
}

Bytes Pattern(size_t size, uint32_t salt) {
  Bytes b(size);
  uint32_t x = salt * 2654435761u + 1;
  for (size_t i = 0; i < size; ++i) {
    x = x * 1103515245u + 12345u;
    b[i] = uint8_t(x >> 16);
  }
  return b;
}

std::string RepeatText(const std::string& line, size_t chars) {
  std::string out;
  while (out.size() < chars) out += line;
  return out;
}

class Builder {
 public:
  explicit Builder(StoreContent* content) : c_(content) {}

  size_t Mailbox(const std::string& name) {
    ManifestMailbox mb;
    mb.name = name;
    mb.number = kFirstMailboxNumber + c_->mailboxes.size();
    mb.property = UserSid(uint32_t(1000 + c_->mailboxes.size()));
    c_->mailboxes.push_back(mb);
    return c_->mailboxes.size() - 1;
  }

  // `parent_id` is the parent's folder id (or mailbox number, or 0).
  size_t Folder(uint64_t parent_id, const std::string& name, const std::string& cls,
                uint64_t id = 0) {
    ManifestFolder f;
    f.id = id ? id : kFolderIdBase + next_folder_++;
    f.parent = parent_id;
    f.name = name;
    f.container_class = cls;
    c_->folders.push_back(f);
    return c_->folders.size() - 1;
  }
  uint64_t Id(size_t folder) const { return c_->folders[folder].id; }

  ManifestItem& Item(size_t folder, const std::string& cls, const std::string& prefix,
                     const std::string& subject, const std::string& sender, uint64_t received) {
    ManifestItem it;
    it.key = ItemKey(++counter_);
    it.message_class = cls;
    it.subject_prefix = prefix;
    it.normalized_subject = subject;
    it.sender = sender;
    it.received = received;
    it.created = received - 5 * kMinute;
    it.modified = received + kHour;
    it.flags = kFlagRead;
    it.importance = kImportanceNormal;
    c_->folders[folder].items.push_back(std::move(it));
    return c_->folders[folder].items.back();
  }

  ManifestItem& Mail(size_t folder, const std::string& prefix, const std::string& subject,
                     const std::string& sender, const std::string& to, uint64_t received) {
    ManifestItem& it = Item(folder, "IPM.Note", prefix, subject, sender, received);
    it.to = to;
    return it;
  }

  static void Attach(ManifestItem* it, const std::string& display, const std::string& file,
                     Bytes data, const std::string& long_name = "") {
    ManifestAttachment a;
    a.display_name = display;
    a.file_name = file;
    a.long_file_name = long_name;
    a.data = std::move(data);
    a.method = kAttachByValue;
    it->attachments.push_back(std::move(a));
    it->has_attachments = true;
    it->flags |= kFlagHasAttach;
  }

  uint64_t counter() const { return counter_; }

 private:
  StoreContent* c_;
  uint64_t next_folder_ = 0;
  uint64_t counter_ = 0;
};

void FillMailbox(Builder& b, StoreContent* c, size_t mailbox, bool full) {
  const ManifestMailbox& mb = c->mailboxes[mailbox];
  const size_t top = b.Folder(mb.number, "Top of Information Store", "IPF.Note");
  const uint64_t t = b.Id(top);
  const size_t inbox = b.Folder(t, "Inbox", "IPF.Note");
  const size_t sent = b.Folder(t, "Sent Items", "IPF.Note");
  const size_t deleted = b.Folder(t, "Deleted Items", "IPF.Note");
  const size_t calendar = b.Folder(t, "Calendar", "IPF.Appointment");
  const size_t contacts = b.Folder(t, "Contacts", "IPF.Contact");
  const std::string owner = mb.name;
  const std::string m = std::to_string(mailbox + 1);

  ManifestItem& hello = b.Mail(inbox, "", "Grüße aus Köln — café, naïve, Ærø", "Zoë Größer", owner,
                               Utc(2021, 3, 28, 0, 59, 59));
  hello.body_text = "Hallo,\r\nliebe Grüße aus Köln.\r\n";
  Builder::Attach(&hello, "résumé.txt", "RESUME~1.TXT", Pattern(kSmallAttachment, 1 + mailbox));
  c->bulk_mail_folders.push_back(inbox);
  c->bulk_mail_folders.push_back(sent);

  ManifestItem& sent_mail = b.Mail(sent, "", "Отчёт за март " + m, owner,
                                   "Пётр Иванов; Ольга Смирнова", Utc(2021, 3, 28, 1, 0, 0));
  sent_mail.flags = kFlagRead | kFlagFromMe;
  sent_mail.body_html = "<html><body><p>Отчёт во вложении.</p></body></html>";
  Builder::Attach(&sent_mail, "Отчёт.pdf", "REPORT~1.PDF", Pattern(kLargeAttachment, 7 + mailbox),
                  "Отчёт за март.pdf");

  ManifestItem& trash = b.Mail(deleted, "FW: ", "Ψηφιακή υπογραφή", "Γιώργος Παπαδόπουλος", owner,
                               Utc(2021, 10, 31, 0, 30));
  trash.importance = kImportanceLow;
  trash.rtf_text = "{\\rtf1\\ansi\\ansicpg1253 \\u936?\\u951? deleted}";

  ManifestItem& meeting = b.Item(calendar, "IPM.Appointment", "", "Quartalsplanung " + m, owner,
                                 Utc(2021, 10, 31, 1, 30));
  meeting.times["T814e"] = Utc(2021, 10, 31, 0, 30);  // start, before the clocks go back
  meeting.times["T8198"] = Utc(2021, 10, 31, 2, 30);  // end, after
  meeting.strings["S810c"] = "Raum Δ-3";
  meeting.numbers["L805c"] = 2;
  meeting.body_text = "Agenda folgt.";

  ManifestItem& contact =
      b.Item(contacts, "IPM.Contact", "", "Åsa Ødegård", owner, Utc(2020, 2, 29, 12, 0));
  contact.strings["S3a06"] = "Åsa";
  contact.strings["S3a11"] = "Ødegård";
  contact.strings["S3a16"] = "Nordlys AS";
  contact.strings["S3a17"] = "Direktør";
  contact.strings["S3a08"] = "+47 22 00 00 0" + m;
  contact.strings["S3a1c"] = "+47 900 00 00" + m;
  contact.times["T3a42"] = Utc(1980, 2, 29, 0, 0);
  contact.numbers["I3a4d"] = 1;
  if (!full) return;

  const size_t outbox = b.Folder(t, "Outbox", "IPF.Note");
  const size_t drafts = b.Folder(t, "Drafts", "IPF.Note");
  const size_t tasks = b.Folder(t, "Tasks", "IPF.Task");
  const size_t notes = b.Folder(t, "Notes", "IPF.StickyNote");
  const size_t journal = b.Folder(t, "Journal", "IPF.Journal");
  const size_t junk = b.Folder(t, "Junk E-mail", "IPF.Note");
  const size_t lower_inbox = b.Folder(t, "inbox ", "IPF.Note");
  const size_t projects = b.Folder(b.Id(inbox), "Projekte Übersicht", "IPF.Note");
  const size_t deep = b.Folder(b.Id(projects), "Глубокая папка", "IPF.Note");
  const size_t greek = b.Folder(t, "Ελληνικά", "IPF.Note");
  const size_t cjk = b.Folder(t, "日本語フォルダ", "IPF.Note");
  const size_t arabic = b.Folder(t, "مجلد عربي", "IPF.Note");
  const size_t emoji = b.Folder(t, "📁 Emoji 🎉", "IPF.Note");
  const size_t archive = b.Folder(t, "Archiv 2009", "IPF.Note", kInnerZerosFolderId);
  const size_t foreign = b.Folder(t, "Replikat", "IPF.Note", kNoZeroRunFolderId);
  (void)outbox;
  c->bulk_mail_folders.push_back(projects);

  ManifestItem& html = b.Mail(inbox, "RE: ", "Встреча в понедельник", "Ольга Смирнова", owner,
                              Utc(2021, 3, 14, 6, 59, 59));
  html.body_html =
      "<html><head><meta charset=\"utf-8\"></head><body><b>Да</b>, в 10:00.</body></html>";
  html.body_text = "Да, в 10:00.";
  html.importance = kImportanceHigh;
  Builder::Attach(&html, "Plan.xlsx", "", Pattern(kLargeAttachment + 1234, 42));

  ManifestItem& rtf = b.Mail(inbox, "", "Nur RTF — kein Klartext", "Jürgen Müller", owner,
                             Utc(2021, 3, 14, 7, 0, 0));
  rtf.rtf_text = "{\\rtf1\\ansi\\ansicpg1252\\pard Nur RTF, \\'fcberall.\\par}\r\n";

  ManifestItem& rtf2 = b.Mail(inbox, "AW: ", "RTF mit Wiederholungen", "Jürgen Müller", owner,
                              Utc(2021, 3, 14, 8, 0, 0));
  rtf2.rtf_text = "{\\rtf1\\ansi\\ansicpg1252\\deff0{\\fonttbl{\\f0\\fswiss Arial;}}\\pard\\plain" +
                  RepeatText("\\f0\\fs20 Wiederholung, Wiederholung. \\par ", 600) + "}\r\n";
  rtf2.rtf_uses_references = true;
  rtf2.body_text = "Wiederholung, Wiederholung.";

  ManifestItem& big =
      b.Mail(inbox, "", "🎉 Einladung 🎂 party", "Émilie Dubois", owner, Utc(2021, 11, 7, 5, 59));
  big.body_text = RepeatText("Ünïcödé body line with emoji 😀 and more text.\r\n", kLargeBodyChars);

  ManifestItem& hostile =
      b.Mail(inbox, "", "Anhänge mit bösen Namen", "Mallory", owner, Utc(2021, 11, 7, 6, 0));
  hostile.body_text = "see attachments";
  Builder::Attach(&hostile, "../../etc/passwd", "", Pattern(64, 2));
  Builder::Attach(&hostile, "", "a/b\\c", Pattern(65, 3));
  Builder::Attach(&hostile, "con\x01trol\x07name.txt", "CONTRO~1.TXT", Pattern(66, 4));
  Builder::Attach(&hostile, "", "", Pattern(17, 5));

  ManifestItem& cjk_mail =
      b.Mail(cjk, "", "会議の議事録 📄", "محمد العربي", owner, Utc(2021, 6, 1, 23, 59, 59));
  cjk_mail.body_text = "議事録を添付します。";
  cjk_mail.headers =
      "Received: from mx.example.org\r\nMessage-ID: <cjk-1@example.org>\r\n"
      "Subject: =?UTF-8?B?5Lya6K2w44Gu6K2w5LqL6Yyy?=\r\n";

  ManifestItem& request = b.Item(inbox, "IPM.Schedule.Meeting.Request", "", "Review 2021",
                                 "Ольга Смирнова", Utc(2021, 3, 27, 12, 0));
  request.to = owner;
  request.times["T814e"] = Utc(2021, 3, 28, 0, 30);
  request.times["T8198"] = Utc(2021, 3, 28, 1, 30);
  request.strings["S810c"] = "Konferenzraum 1";

  ManifestItem& draft = b.Mail(drafts, "", "Entwurf", owner, "", Utc(2021, 1, 1, 0, 0));
  draft.flags = kFlagUnsent | kFlagUnmodified;

  ManifestItem& task =
      b.Item(tasks, "IPM.Task", "", "Steuererklärung abgeben", owner, Utc(2021, 5, 1, 9, 0));
  task.times["T8078"] = Utc(2021, 5, 1, 0, 0);   // task start
  task.times["T8079"] = Utc(2021, 5, 31, 0, 0);  // task due
  task.doubles["D8121"] = 0.25;
  task.numbers["L8138"] = 1;
  task.numbers["L26"] = 2;
  task.numbers["B8124"] = 1;
  task.strings["S814a"] = owner;
  task.body_text = "Belege sammeln.";

  ManifestItem& note =
      b.Item(notes, "IPM.StickyNote", "", "Milch kaufen", owner, Utc(2021, 2, 2, 2, 2));
  note.body_text = "Milch kaufen\r\nBrot";

  ManifestItem& entry =
      b.Item(journal, "IPM.Activity", "", "Telefonat mit Kunde", owner, Utc(2021, 4, 4, 14, 0));
  entry.body_text = "15 Minuten, Angebot besprochen.";

  ManifestItem& list =
      b.Item(contacts, "IPM.DistList", "", "Projektteam", owner, Utc(2021, 4, 5, 8, 0));
  list.members = {{"Åsa Ødegård", "SMTP", "asa@nordlys.example"},
                  {"Пётр Иванов", "SMTP", "petr@example.ru"},
                  {"山田 太郎", "EX", "/o=Org/ou=Site/cn=Recipients/cn=yamada"}};

  ManifestItem& junk_mail =
      b.Mail(junk, "", "You have WON!!!", "spam@example.com", owner, Utc(2021, 7, 7, 7, 7));
  junk_mail.flags = 0;
  junk_mail.body_html = "<html><body><a href=\"http://x.example\">click</a></body></html>";

  ManifestItem& post =
      b.Item(lower_inbox, "IPM.Post", "", "Notiz an mich", owner, Utc(2021, 8, 8, 8, 8));
  post.body_text = "Ein Beitrag.";

  b.Mail(projects, "", "Projektstatus KW 12", "Jürgen Müller", owner, Utc(2021, 3, 26, 10, 0))
      .body_text = "Alles im Plan.";
  b.Mail(deep, "", "Глубоко вложенное письмо", "Пётр Иванов", owner, Utc(2021, 3, 26, 11, 0))
      .body_text = "Тест.";
  b.Mail(greek, "", "Καλημέρα κόσμε", "Ελένη", owner, Utc(2021, 3, 26, 12, 0)).body_text =
      "Γειά σου.";
  b.Mail(arabic, "", "مرحبا بالعالم", "محمد العربي", owner, Utc(2021, 3, 26, 13, 0)).body_text =
      "مرحبا";
  b.Mail(emoji, "", "😀😃😄", "Emoji Fan", owner, Utc(2021, 3, 26, 14, 0)).body_text = "🙂";
  b.Mail(archive, "", "Altes Archiv", "Archivar", owner, Utc(2009, 12, 31, 23, 0)).body_text =
      "2009";
  b.Mail(foreign, "", "Aus einem anderen Replikat", "Replikator", owner, Utc(2010, 1, 1, 0, 0))
      .body_text = "Replikat";
}

void FillPublic(Builder& b, StoreContent* c) {
  const size_t root = b.Folder(kRootFolderParent, "Public Root", "IPF.Note");
  const uint64_t r = b.Id(root);
  const size_t marketing = b.Folder(r, "Marketing", "IPF.Note");
  const size_t campaigns = b.Folder(b.Id(marketing), "Kampagnen 2021", "IPF.Note");
  const size_t calendar = b.Folder(r, "Firmenkalender", "IPF.Appointment");
  const size_t contacts = b.Folder(r, "Kontakte", "IPF.Contact");
  const size_t inbox = b.Folder(r, "Inbox", "IPF.Note");
  c->bulk_mail_folders = {marketing, campaigns};

  ManifestItem& post = b.Item(marketing, "IPM.Post", "", "Neue Broschüre", "Marketing Team",
                              Utc(2021, 3, 28, 1, 15));
  post.body_text = "Die neue Broschüre liegt bei.";
  Builder::Attach(&post, "Broschüre.pdf", "BROSCH~1.PDF", Pattern(kLargeAttachment, 99));

  b.Item(campaigns, "IPM.Post", "RE: ", "Kampagne Frühling", "Jürgen Müller",
         Utc(2021, 3, 20, 9, 0))
      .body_html = "<html><body><i>Frühling</i></body></html>";

  ManifestItem& event =
      b.Item(calendar, "IPM.Appointment", "", "Betriebsfeier", "Personal", Utc(2021, 12, 1, 9, 0));
  event.times["T814e"] = Utc(2021, 12, 17, 17, 0);
  event.times["T8198"] = Utc(2021, 12, 17, 23, 0);
  event.strings["S810c"] = "Kantine";

  ManifestItem& contact =
      b.Item(contacts, "IPM.Contact", "", "Empfang", "Personal", Utc(2021, 1, 4, 8, 0));
  contact.strings["S3a06"] = "Empfang";
  contact.strings["S3a08"] = "+49 221 000000";

  b.Item(inbox, "IPM.Post", "", "Öffentlicher Posteingang", "Postmaster", Utc(2021, 2, 1, 8, 0))
      .body_text = "Willkommen.";
}

}  // namespace

// A Windows security identifier S-1-5-21-a-b-c-rid: revision, count of
// sub-authorities, 6-byte big-endian authority, little-endian sub-authorities.
Bytes UserSid(uint32_t rid) {
  const uint32_t sub[] = {21, 1004336348, 1177238915, 682003330, rid};
  Bytes b = {1, uint8_t(std::size(sub)), 0, 0, 0, 0, 0, 5};
  for (uint32_t v : sub) {
    for (int i = 0; i < 4; ++i) b.push_back(uint8_t(v >> (8 * i)));
  }
  return b;
}

Bytes ItemKey(uint64_t counter) {
  Bytes key(kKeySize);
  key[0] = uint8_t(kKeyReplica >> 8);
  key[1] = uint8_t(kKeyReplica);
  for (size_t i = 0; i < 6; ++i) key[2 + i] = uint8_t(counter >> (8 * (5 - i)));
  return key;
}

StoreContent MakeFixtureContent(bool public_store, const DamageOptions& damage,
                                const BulkOptions& bulk) {
  StoreContent c;
  c.public_store = public_store;
  Builder b(&c);
  uint64_t top_parent = 0;
  size_t inbox = 0;
  if (public_store) {
    FillPublic(b, &c);
    top_parent = c.folders[0].id;
    inbox = 1;
  } else {
    const char* const names[] = {"Müller, Jürgen", "Иванов Пётр", "山田 太郎"};
    for (size_t i = 0; i < std::size(names); ++i) b.Mailbox(names[i]);
    for (size_t i = 0; i < std::size(names); ++i) FillMailbox(b, &c, i, i == 0);
    top_parent = c.folders[0].id;  // the first mailbox's top folder
    inbox = 1;
  }

  if (bulk.large_folder_items > 0) {
    c.bulk_folder = b.Folder(top_parent, "Bulk", "IPF.Note");
  }
  if (damage.orphan_folder) {
    const size_t f = b.Folder(kMissingParentId, "Verwaist", "IPF.Note");
    c.folders[f].damage = "orphan";
    b.Mail(f, "", "Im verwaisten Ordner", "Niemand", "", Utc(2021, 9, 9, 9, 9)).body_text = "?";
  }
  if (damage.self_parent_folder) {
    const size_t f = b.Folder(0, "Selbstbezug", "IPF.Note");
    c.folders[f].parent = c.folders[f].id;
    c.folders[f].damage = "self_parent";
    b.Mail(f, "", "Im eigenen Elternordner", "Niemand", "", Utc(2021, 9, 9, 9, 10));
  }
  if (damage.parent_zero_folder) {
    const size_t f = b.Folder(0, "Ohne Eltern", "IPF.Note");
    c.folders[f].damage = "parent_zero";
  }
  if (damage.content_row_without_msg) {
    ManifestItem& ghost =
        b.Mail(inbox, "", "Nur in der Inhaltstabelle", "Geist", "", Utc(2021, 9, 9, 9, 11));
    ghost.in_msg_table = false;
  }
  if (damage.duplicate_message) {
    c.duplicates.push_back({c.folders[inbox].items.front().key, "DUPLICATE ROW, MUST NOT COUNT"});
  }
  c.next_message_counter = b.counter() + 1;
  return c;
}

BulkMailSource::BulkMailSource(const StoreContent& content, const BulkOptions& options)
    : content_(content),
      options_(options),
      state_(options.seed),
      folder_state_(~options.seed),
      counter_(content.next_message_counter) {}

// splitmix64: fast, and the same sequence for the same seed everywhere.
uint64_t BulkMailSource::Mix(uint64_t* state) {
  uint64_t z = (*state += 0x9E3779B97F4A7C15ull);
  z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
  z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
  return z ^ (z >> 31);
}

bool BulkMailSource::NextFolder(size_t* folder) {
  if (drawn_ >= options_.messages) return false;
  const bool large = drawn_ < options_.large_folder_items && content_.bulk_folder != SIZE_MAX;
  if (large) {
    *folder = content_.bulk_folder;
  } else if (!content_.bulk_mail_folders.empty()) {
    *folder = content_.bulk_mail_folders[Mix(&folder_state_) % content_.bulk_mail_folders.size()];
  } else {
    *folder = 0;
  }
  ++drawn_;
  return true;
}

bool BulkMailSource::Next(size_t* folder, ManifestItem* item) {
  static const char* const kWords[] = {"meeting", "Bericht", "отчёт",  "budget", "Entwurf",
                                       "review",  "Projekt", "статус", "update", "Rechnung",
                                       "travel",  "agenda",  "会議",   "lunch",  "deadline"};
  static const char* const kSenders[] = {"Jürgen Müller", "Пётр Иванов", "山田 太郎", "Åsa Ødegård",
                                         "Émilie Dubois"};
  if (!NextFolder(folder)) return false;
  *item = ManifestItem();
  item->key = ItemKey(counter_++);
  item->message_class = "IPM.Note";
  for (int i = 0, n = 2 + int(Below(5)); i < n; ++i) {
    if (i) item->normalized_subject += ' ';
    item->normalized_subject += kWords[Below(std::size(kWords))];
  }
  item->sender = kSenders[Below(std::size(kSenders))];
  item->to = "Bulk Recipient";
  item->received = Utc(2020, 1, 1, 0, 0) + drawn_ * 7 * kMinute;
  item->created = item->received - kMinute;
  item->modified = item->received + kMinute;
  item->flags = (Below(2) ? kFlagRead : 0);
  item->importance = kImportanceNormal;
  // About half the byte budget goes to the body (UTF-16, two bytes a
  // character), the rest to the attachments of every n-th message.
  const uint64_t body_chars = std::max<uint64_t>(16, Below(options_.average_bytes / 2 + 1));
  std::string body;
  while (body.size() < body_chars) {
    body += kWords[Below(std::size(kWords))];
    body += Below(8) ? " " : ".\r\n";
  }
  item->body_text = std::move(body);
  if (options_.attachment_every && drawn_ % options_.attachment_every == 0) {
    const uint64_t size =
        1 + Below(std::max<uint64_t>(2, options_.average_bytes * options_.attachment_every));
    ManifestAttachment a;
    a.display_name = "bulk-" + std::to_string(drawn_) + ".bin";
    a.file_name = "BULK" + std::to_string(drawn_ % 10000) + ".BIN";
    a.data = Pattern(size_t(size), uint32_t(drawn_));
    a.method = kAttachByValue;
    item->attachments.push_back(std::move(a));
    item->has_attachments = true;
    item->flags |= kFlagHasAttach;
  }
  return true;
}

}  // namespace tarnwell::forge::exchange
