// The store model's vocabulary: folders, and the current-item records that
// decoding one table row fills.
//
// There is no item object that outlives a decode: each decode overwrites the
// records of its purpose, and whoever needs the values copies them out.
// Times are FILETIMEs (100-ns ticks since 1601-01-01 UTC); std::nullopt
// means the column was absent. Text is UTF-8.
#ifndef TARNWELL_STORE_ITEM_RECORDS_H_
#define TARNWELL_STORE_ITEM_RECORDS_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "base/byte_view.h"

namespace tarnwell::store {

// The scanning mode letter.
enum class ScanMode : char { kStandard = 'S', kAdvance = 'A', kDeep = 'D' };

using FileTime = std::optional<uint64_t>;

struct FolderNode {
  std::string display_name;     // "S3001" / "DisplayName"
  uint64_t folder_id = 0;       // "Q6748" / "FolderId" ("Q6764" for a mailbox row)
  uint64_t parent_id = 0;       // "Q6749" / "ParentFolderId"
  uint32_t first_child = 0;     // index in the folder list; 0 = none
  uint32_t next_sibling = 0;    // index in the folder list; 0 = none
  std::string container_class;  // "S3613" / "ContainerClass", e.g. "IPF.Contact"
  std::string source_table;     // modern generation: the folder table of the row
  uint8_t state = 0;            // 1: a modern mailbox whose folder table is named
};

// Which record a row's values go to. Exactly one is on while a row decodes.
enum class DecodePurpose {
  kNone,
  kMailboxRow,
  kFolderRow,
  kMessageListRow,
  kMessageDetail,
  kContactDetail,
  kAppointmentDetail,
  kTaskDetail,
  kAttachmentRow,
};

struct MessageSummary {
  uint64_t message_key = 0;  // first 8 bytes of "N67b0"
  std::string to;            // "Se04" / "S678e" (not for Exchange 5.5)
  std::string sender;        // "S42"
  std::string cc;
  std::string subject;        // "S3d" prefix followed by "Se1d"
  std::string message_class;  // "S1a"
  std::string created;        // DateText of "T3007"
  std::string modified;       // DateText of "T3008"
  std::string received;       // DateText of "Te06"
  std::string flags_text;     // from "Le07"
  uint32_t importance = 0;    // "L17"
  uint8_t has_attachments = 0;
};

// One member of a distribution list.
struct ListMember {
  std::string display_name;
  std::string address_type;
  std::string email_address;
};

struct MessageRecord {
  Bytes body;                     // "N1013"; or "S1000" when no body was set
  bool body_is_text = false;      // body holds text (UTF-8) rather than bytes
  std::optional<Bytes> rtf_body;  // "N1009", expanded (closing bytes included)
  uint64_t rtf_compressed_length = 0;
  Bytes stream_page_list;          // "F6659"
  Bytes further_binary_1;          // "N67b4"
  Bytes further_binary_2;          // "N67b3"
  std::string named_multi_string;  // "MS813a"
  std::string n67b6_first, n67b6_second;
  std::string n3fca;
  uint32_t internet_code_page = 0;      // "L3fde"
  uint32_t sensitivity = 0;             // "L36"
  FileTime creation_time;               // "T3007", "T8100"
  FileTime named_time_1;                // "T811f" or "T807a"
  FileTime named_time_2;                // "T82cc"
  FileTime named_time_3;                // "T82e7"
  uint32_t named_value = 0;             // "L82e6"
  std::string named_string;             // "S8203"
  uint8_t response_requested = 0;       // "B63"
  uint8_t reassignment_prohibited = 0;  // "B2b"
  int32_t b2 = 0;                       // "B2": +1 true, -1 false, 0 absent
  uint32_t b23 = 0, b29 = 0, b3016 = 0;
  std::vector<ListMember> members;    // "MN81a9" / "MN8165"
  std::string transport_headers;      // "S7d"
  std::string in_reply_to;            // "S1042"
  std::string reply_recipient_names;  // "S50"
  std::string s1046;
  Bytes conversation_index;  // "N71"
  uint16_t body_type = 0;
  // Every other string and named value met, by column name, so that writers
  // can find what the fixed fields do not hold.
  std::map<std::string, std::string> strings;
  std::map<std::string, uint32_t> named_values;
};

struct ContactRecord {
  std::map<std::string, std::string> strings;  // by column name, e.g. "S3a06"
  FileTime birthday;                           // "T3a42" or "T8159"
  FileTime anniversary;                        // "T3a41" or "T815a"
  uint16_t gender = 0;                         // "I3a4d"
  uint32_t contact_value = 0;                  // "L8098"
  std::string s808b;
  uint8_t response_requested = 0;
  uint8_t reassignment_prohibited = 0;
  Bytes conversation_index;
};

struct AppointmentRecord {
  FileTime end_time;       // "T8198", "T810b", "T814d", "T61", "T8196"
  FileTime creation_time;  // "T8100", "T39", "DateCreated"
  std::string s810c;
  uint32_t value_present = 0;
  FileTime named_time;  // "T8033"
  uint32_t value = 0;   // "L805c"; "L81ff" (2007); "L81e9" (2000/2003)
  FileTime start_time;  // "T814e", "T8197", "T60", "T81ef"
  std::string s8051_or_s8201, s80fd;
  uint8_t flag = 0;       // "B828c"
  std::string body_text;  // "S1000"
  uint32_t sensitivity = 0;
  std::string s8068, s8186;
  FileTime named_time_2;  // "T8102"
  uint8_t response_requested = 0;
  uint8_t reassignment_prohibited = 0;
  int32_t b2 = 0;
  std::map<std::string, std::string> strings;  // every string column of the list
  Bytes conversation_index;
};

struct TaskRecord {
  FileTime times[5];  // "T8078"|"T81ef"; "T811e"|"T8079"; "T811f"|"T807a"; "Tf"; "T3fef"
  std::string s814a, ms813a, s808b;
  FileTime time_6;              // "T8125" or "T807e"
  FileTime time_7;              // "T39"
  uint32_t flag = 0;            // "B8124"
  double percent_complete = 0;  // "D8121"
  uint32_t value = 0;           // "L8138"
  uint32_t sensitivity = 0;
  uint32_t priority = 0;
  uint32_t internet_code_page = 0;
  uint8_t response_requested = 0;
  uint8_t reassignment_prohibited = 0;
  std::string body_text;  // "S1000"
  std::map<std::string, std::string> strings;
  Bytes conversation_index;
};

struct AttachmentRecord {
  std::string name;                            // "S3001" or "S3704", whichever comes first
  Bytes data;                                  // "N3701"
  Bytes stream_page_list;                      // "F3701"
  Bytes further_data;                          // "J3701"
  Bytes subobjects;                            // "SubobjectsBlob"
  std::map<std::string, std::string> strings;  // "S1a", "S3704", "S3707", ...
  uint32_t l65f1 = 0;
  uint64_t key = 0;  // "Q3f88" / "Q674a": first 8 bytes, little-endian
};

// Everything one decode may fill; the purpose says which part.
struct ItemRecords {
  FolderNode node;  // mailbox or folder row under construction
  MessageSummary summary;
  MessageRecord message;
  ContactRecord contact;
  AppointmentRecord appointment;
  TaskRecord task;
  AttachmentRecord attachment;
};

// The texts of the message-flag bits, each followed by a comma, in bit order.
std::string MessageFlagsText(uint32_t flags);

}  // namespace tarnwell::store

#endif  // TARNWELL_STORE_ITEM_RECORDS_H_
