#include "app/item_render.h"

#include "app/file_export_job.h"
#include "render/ical_writer.h"
#include "render/vcard_writer.h"

namespace tarnwell::app {
namespace {

bool ParseCalendarDate(const std::string& text, CalendarDate* date) {
  int y, mo, d, h, mi, s;
  if (!render::ParseDateText(text, &y, &mo, &d, &h, &mi, &s)) return false;
  *date = {y, mo, d};
  return true;
}

}  // namespace

ItemKind KindOf(const std::string& message_class) {
  const std::string& c = message_class;
  if (c == "IPM.Contact" || c == "IPF.Contact") return ItemKind::kContact;
  if (c == "IPM.Appointment" || c == "IPF.Appointment" || c == "IPM.Appointment.Private Calendar" ||
      c == "IPM.Schedule.Meeting.Request") {
    return ItemKind::kAppointment;
  }
  if (c == "IPM.Task" || c == "IPF.Task") return ItemKind::kTask;
  if (c == "IPM.DistList" || c == "IPF.DistList") return ItemKind::kDistList;
  if (c == "IPM.Activity" || c == "IPF.Activity") return ItemKind::kJournal;
  if (c == "IPM.Post" || c == "IPF.Post" || c == "IPM.StickyNote" || c == "IPF.StickyNote") {
    return ItemKind::kNote;
  }
  return ItemKind::kMessage;
}

std::string ItemDateText(const store::MessageSummary& row) {
  return !row.received.empty() ? row.received : row.created;
}

bool ItemFilter::Passes(const store::MessageSummary& row) {
  if (options_.date_mode != DateMode::kAllTime) {
    CalendarDate date;
    if (ParseCalendarDate(ItemDateText(row), &date)) {
      bool inside = false;
      for (const DateRange& r : options_.date_ranges) inside = inside || InRange(date, r);
      if (options_.date_mode == DateMode::kInside ? !inside : inside) return false;
    }
  }
  return !options_.dedup_on || digests_.insert(DuplicateDigest(row, options_.dedup_by)).second;
}

bool OpenItem(store::MailStore& store, store::FolderRef folder, const store::MessageSummary& row,
              const render::TextMode& text_mode, OpenedItem* item) {
  store::DecodePurpose purpose;
  std::optional<store::ItemRecords> records = store.OpenMessage(folder, row.message_key, &purpose);
  if (!records) return false;
  item->row = &row;
  item->records = std::move(*records);
  item->attachments = store.ListAttachments(folder, row.message_key);
  item->message_class = row.message_class.empty() ? "IPM.Note" : row.message_class;
  item->kind = KindOf(item->message_class);
  item->headers.to = row.to;
  item->headers.from = row.sender;
  item->headers.cc = row.cc;
  item->headers.subject = row.subject;
  item->headers.date_text = ItemDateText(row);
  item->native.clear();
  item->native_extension.clear();
  if (item->kind == ItemKind::kContact) {
    item->native =
        render::ComposeVCard(render::ContactFromRecord(item->records.contact), text_mode);
    item->native_extension = ".vcf";
  } else if (item->kind == ItemKind::kAppointment) {
    render::AppointmentItem a;
    a.subject = row.subject;
    a.created_text = row.created;
    a.importance = row.importance;
    item->native = render::ComposeICalendar(item->records.appointment, a, text_mode);
    item->native_extension = ".ics";
  }
  return true;
}

Status ComposeItem(OpenedItem& item, const std::string& carrier_name,
                   const render::ComposeOptions& options, render::MimeSink* out) {
  const store::FileTime date = item.records.message.creation_time;
  if (!item.native.empty()) {
    if (carrier_name.empty()) return Status::InvalidArgument("the item has a file of its own");
    return render::ComposeCarrier(item.kind == ItemKind::kContact ? "text/vcard" : "text/calendar",
                                  carrier_name, item.native, date, item.attachments, item.headers,
                                  options, out);
  }
  if (item.kind == ItemKind::kTask) {
    return render::ComposeTask(item.records.task, item.records.message.rtf_body, date,
                               item.attachments, item.headers, options, out);
  }
  return render::ComposeMessage(item.records.message, date, item.attachments, item.headers, options,
                                out);
}

}  // namespace tarnwell::app
