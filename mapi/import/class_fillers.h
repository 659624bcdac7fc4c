// Class fillers: after a composed file has been imported into a new item,
// they set the properties the file does not carry, from the decoded item
// records. One filler per item class; FillFromRecords picks it by the
// message class.
//
// A value that is absent in the record sets nothing: texts only when not
// empty, 32-bit values and flags only when not zero, times only when
// present. A value the imported file already gave is kept where the file is
// the better source (the HTML's code page, the subject), and replaced where
// the record is (transport headers, the read flag, the delivery time).
//
// The records keep named properties under the column names of the database
// ("S8083", "L8b00"). Only names whose meaning is certain are carried over:
// the contact strings of the address property set under their usual ids, and
// the sticky-note and journal values of theirs; any other named column is
// left out rather than stored under a guessed meaning.
#ifndef TARNWELL_MAPI_IMPORT_CLASS_FILLERS_H_
#define TARNWELL_MAPI_IMPORT_CLASS_FILLERS_H_

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "mapi/property_bag.h"
#include "store/item_records.h"

namespace tarnwell::mapi {

enum class FillerKind {
  kMail,  // mail, posts, and every class without a filler of its own
  kStickyNote,
  kJournal,
  kTask,
  kDistributionList,
  kAppointment,
  kContact,
};

// The filler for a message class, compared exactly ("IPM.Contact" and "IPF.Contact" are
// contacts; "IPM.Note.Custom" is mail).
FillerKind FillerKindFor(std::string_view message_class);

void FillMail(const store::MessageRecord& record, const store::MessageSummary& row, Message* out);
void FillStickyNote(const store::MessageRecord& record, const store::MessageSummary& row,
                    Message* out);
void FillJournal(const store::MessageRecord& record, const store::MessageSummary& row,
                 Message* out);
void FillDistributionList(const store::MessageRecord& record, const store::MessageSummary& row,
                          Message* out);
void FillTask(const store::TaskRecord& record, const store::MessageSummary& row, Message* out);
void FillAppointment(const store::AppointmentRecord& record, const store::MessageSummary& row,
                     Message* out);
void FillContact(const store::ContactRecord& record, const store::MessageSummary& row,
                 Message* out);

// Sets PidTagMessageClass to `message_class` ("IPF." classes become their "IPM." item
// class) and runs the filler for it with the record of its kind.
void FillFromRecords(const store::ItemRecords& records, const store::MessageSummary& row,
                     const std::string& message_class, Message* out);

// The PidTagMessageFlags bits a flags text names ("Read,Unmodified," or the modern
// "Read" / "UnRead"); nullopt for an empty text.
std::optional<int32_t> MessageFlagsFromText(std::string_view text);

// A distribution list's members as one-off entry identifiers, in order.
std::vector<Bytes> MemberEntryIds(const std::vector<store::ListMember>& members);

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_IMPORT_CLASS_FILLERS_H_
