// What the file export job and the PST export job share per item: the kind
// of an item by its message class, the filters of the filter page (date
// ranges, duplicates), and the item rendered as a composed file.
#ifndef TARNWELL_APP_ITEM_RENDER_H_
#define TARNWELL_APP_ITEM_RENDER_H_

#include <optional>
#include <set>
#include <string>
#include <vector>

#include "app/export_options.h"
#include "base/status.h"
#include "render/content_line.h"
#include "render/eml_composer.h"
#include "render/mime/mime_sink.h"
#include "store/mail_store.h"

namespace tarnwell::app {

enum class ItemKind { kMessage, kTask, kContact, kAppointment, kDistList, kJournal, kNote };

ItemKind KindOf(const std::string& message_class);

// The filter page's tests for the items of one folder: the date filter on
// the item's arrival (else creation) date, and duplicate removal, which
// counts within the folder.
class ItemFilter {
 public:
  explicit ItemFilter(const ExportOptions& options) : options_(options) {}
  bool Passes(const store::MessageSummary& row);

 private:
  const ExportOptions& options_;
  std::set<std::string> digests_;
};

// The date text an item is named and filtered by.
std::string ItemDateText(const store::MessageSummary& row);

// One item read from its store, ready to be composed.
struct OpenedItem {
  const store::MessageSummary* row = nullptr;
  store::ItemRecords records;
  std::vector<store::AttachmentRecord> attachments;
  std::string message_class;  // "IPM.Note" when the row has none
  ItemKind kind = ItemKind::kMessage;
  render::HeaderStrings headers;
  // Contacts and appointments: their vCard / iCalendar text and extension.
  std::string native, native_extension;
};

// Reads an item's records and attachments; false when the store has no
// record for it.
bool OpenItem(store::MailStore& store, store::FolderRef folder, const store::MessageSummary& row,
              const render::TextMode& text_mode, OpenedItem* item);

// Writes the item as a composed Internet message. With `carrier_name`
// non-empty, a contact or an appointment goes out as a message carrying its
// native file under that name; otherwise only messages and tasks are
// composed (callers write the native text themselves). Attachments are
// moved into the output.
Status ComposeItem(OpenedItem& item, const std::string& carrier_name,
                   const render::ComposeOptions& options, render::MimeSink* out);

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_ITEM_RENDER_H_
