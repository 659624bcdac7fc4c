// A contact as a vCard 2.1 file (".vcf"), the form the contact importers of mail programs
// read.
//
// Lines, in this order, each only when its value is present ("+" marks the lines whose
// name gains ";CHARSET=utf-8" when the text is UTF-8):
//
//   BEGIN:VCARD, VERSION:2.1
//   N +        surname;given;middle;prefix;suffix
//   FN +       prefix given middle surname suffix, single spaces
//   ORG +      company;department
//   NICKNAME +, EMAIL + (three)
//   ADR;TYPE=home|work|postal +   box;;street;city;region;postal code;country, each
//   LABEL;TYPE=...;ENCODING=QUOTED-PRINTABLE +   followed by its address text
//   TEL;TYPE=... and the other telephone lines, EMAIL;TLX (telex)
//   TITLE +, ROLE +, URL;WORK +, X-MS-ASSISTANT +, X-MS-MANAGER +, X-MS-SPOUSE +
//   BDAY, X-MS-ANNIVERSARY   the local date, yyyy-mm-dd
//   FBURL +, NOTE;ENCODING=QUOTED-PRINTABLE, X-MS-IMADDRESS +
//   PHOTO;ENCODING=BASE64   then an empty line
//   END:VCARD
//
// N and FN are always written: a card needs them. Without any name part N is empty and FN
// takes the company, the nickname or the first e-mail address, whichever comes first. With
// UTF-8 text a ',' in the surname is written as an (escaped) ';' in N.
//
// All values go through the escaping of content_line.h. Text is UTF-8 or the ANSI code page
// as TextMode says, for the whole file: lines without a CHARSET parameter are written in the
// same character set.
#ifndef TARNWELL_RENDER_VCARD_WRITER_H_
#define TARNWELL_RENDER_VCARD_WRITER_H_

#include <optional>
#include <string>
#include <vector>

#include "base/byte_view.h"
#include "render/content_line.h"
#include "store/item_records.h"

namespace tarnwell::render {

// The attachment name under which a contact keeps its picture.
inline constexpr std::string_view kContactPictureName = "ContactPicture";

struct VCardAddress {
  std::string po_box, street, city, region, postal_code, country;
  std::string label;  // the whole address as one text
};

struct VCardContact {
  std::string surname, given_name, middle_name, prefix, suffix;
  std::string company, department, nickname;
  std::string email[3];
  VCardAddress home, business, other;
  std::string business_fax, business_phone, business_phone_2, car_phone, home_fax, home_phone,
      home_phone_2, isdn, mobile_phone, other_phone, pager, primary_fax, primary_phone, radio_phone,
      telex, tty_tdd_phone, callback_phone, company_main_phone, assistant_phone;
  std::string job_title, profession, business_home_page, assistant, manager, spouse;
  store::FileTime birthday, anniversary;
  std::string free_busy_url, im_address;
  std::string note;              // the item's plain-text body
  std::optional<Bytes> picture;  // image data
};

// The fields of a decoded contact, taken from its string columns (the standard MAPI contact
// properties, and the named ones by their usual identifiers) and its times. The record holds
// neither the body nor the attachments: `note` and `picture` are the caller's to fill.
VCardContact ContactFromRecord(const store::ContactRecord& record);

// The data of the contact's picture attachment: the one named "ContactPicture", with or
// without a file extension, in any letter case. Null when there is none.
const Bytes* FindContactPicture(const std::vector<store::AttachmentRecord>& attachments);

// The complete file.
std::string ComposeVCard(const VCardContact& contact, TextMode mode);

}  // namespace tarnwell::render

#endif  // TARNWELL_RENDER_VCARD_WRITER_H_
