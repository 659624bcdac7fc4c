// Importing an Internet message (.eml) into the message model: what a mail
// program does when it opens a message file as a new item.
//
// The file comes from the EML composer or from anywhere else, so nothing in
// it is trusted: the MIME parser bounds sizes, counts and nesting, embedded
// messages are followed to kMaxEmbeddedDepth levels, and damaged input gives
// whatever could be read. Only input without a single header field fails.
//
// What the header and the parts become:
//
//   Subject                 PidTagSubject, its prefix ("RE: ") and the normalized rest
//   From / Sender           the sent-representing and sender name and SMTP address
//   To, Cc, Bcc             one recipient each, and PidTagDisplayTo/Cc/Bcc
//   Date                    PidTagClientSubmitTime and PidTagMessageDeliveryTime
//   Message-ID, In-Reply-To, References, Reply-To   the matching properties
//   X-Priority, Importance, Priority                PidTagImportance, PidTagPriority
//   the header block        PidTagTransportMessageHeaders, as text
//   first text/plain        PidTagBody, decoded from its charset
//   first text/html         PidTagHtml in the bytes of its charset, PidTagInternetCodepage
//   "rtf-body.rtf"          PidTagRtfCompressed (compressed here) and PidTagRtfInSync
//   message/rfc822          an embedded message (attach method 5)
//   any other part          an attachment by value (attach method 1)
#ifndef TARNWELL_MAPI_IMPORT_INTERNET_MESSAGE_IMPORT_H_
#define TARNWELL_MAPI_IMPORT_INTERNET_MESSAGE_IMPORT_H_

#include <optional>
#include <string>
#include <string_view>

#include "base/byte_view.h"
#include "base/status.h"
#include "mapi/property_bag.h"

namespace tarnwell::mapi {

inline constexpr int kMaxEmbeddedDepth = 8;
// The name under which composed messages carry their RTF body.
inline constexpr std::string_view kRtfBodyFileName = "rtf-body.rtf";

// Fills `out` (which should be empty, or hold only a message class to keep)
// from the message in `eml`. Corruption when `eml` has no header field.
Status ImportInternetMessage(ByteView eml, Message* out);

// An RFC 5322 date ("Fri, 05 Mar 2021 14:07:09 +0100", obsolete zone names
// and two-digit years included) as a FILETIME; nullopt when it is not one.
std::optional<uint64_t> ParseInternetDate(std::string_view text);

// `rtf` as a PidTagRtfCompressed value in the compressed ("LZFu") form.
Bytes CompressRtf(ByteView rtf);

// A one-off entry identifier: a recipient that lives in no address book,
// described by its own name, address type and address (UTF-16 strings).
Bytes OneOffEntryId(std::string_view display_name, std::string_view address_type,
                    std::string_view address);

// One SMTP recipient bag: type, names, address type, addresses, entry id.
PropertyBag SmtpRecipient(int32_t recipient_type, std::string_view display_name,
                          std::string_view address);

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_IMPORT_INTERNET_MESSAGE_IMPORT_H_
