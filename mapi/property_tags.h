// Property ids and property sets of [MS-OXPROPS] that Tarnwell reads or
// writes. Ids only: the type goes with the value.
#ifndef TARNWELL_MAPI_PROPERTY_TAGS_H_
#define TARNWELL_MAPI_PROPERTY_TAGS_H_

#include <cstdint>

#include "mapi/property_bag.h"

namespace tarnwell::mapi {

// Messages.
inline constexpr uint16_t kPidImportance = 0x0017;
inline constexpr uint16_t kPidMessageClass = 0x001A;
inline constexpr uint16_t kPidPriority = 0x0026;
inline constexpr uint16_t kPidSensitivity = 0x0036;
inline constexpr uint16_t kPidSubject = 0x0037;
inline constexpr uint16_t kPidClientSubmitTime = 0x0039;
inline constexpr uint16_t kPidSentRepresentingName = 0x0042;
inline constexpr uint16_t kPidSentRepresentingAddressType = 0x0064;
inline constexpr uint16_t kPidSentRepresentingEmailAddress = 0x0065;
inline constexpr uint16_t kPidConversationTopic = 0x0070;
inline constexpr uint16_t kPidConversationIndex = 0x0071;
inline constexpr uint16_t kPidTransportMessageHeaders = 0x007D;
inline constexpr uint16_t kPidMessageDeliveryTime = 0x0E06;
inline constexpr uint16_t kPidMessageFlags = 0x0E07;
inline constexpr uint16_t kPidMessageSize = 0x0E08;
inline constexpr uint16_t kPidDisplayBcc = 0x0E02;
inline constexpr uint16_t kPidDisplayCc = 0x0E03;
inline constexpr uint16_t kPidDisplayTo = 0x0E04;
inline constexpr uint16_t kPidSubjectPrefix = 0x003D;
inline constexpr uint16_t kPidNormalizedSubject = 0x0E1D;
inline constexpr uint16_t kPidHasAttachments = 0x0E1B;  // computed: PidTagHasAttachments
inline constexpr uint16_t kPidSenderName = 0x0C1A;
inline constexpr uint16_t kPidSenderAddressType = 0x0C1E;
inline constexpr uint16_t kPidSenderEmailAddress = 0x0C1F;
inline constexpr uint16_t kPidSenderSmtpAddress = 0x5D01;
inline constexpr uint16_t kPidBody = 0x1000;
inline constexpr uint16_t kPidRtfCompressed = 0x1009;
inline constexpr uint16_t kPidRtfInSync = 0x0E1F;
inline constexpr uint16_t kPidHtml = 0x1013;
inline constexpr uint16_t kPidInternetMessageId = 0x1035;
inline constexpr uint16_t kPidInReplyToId = 0x1042;
inline constexpr uint16_t kPidInternetCodepage = 0x3FDE;
inline constexpr uint16_t kPidCreationTime = 0x3007;
inline constexpr uint16_t kPidLastModificationTime = 0x3008;
inline constexpr uint16_t kPidResponseRequested = 0x0063;
inline constexpr uint16_t kPidReplyRecipientNames = 0x0050;

// Recipients.
inline constexpr uint16_t kPidRecipientType = 0x0C15;
inline constexpr uint16_t kPidDisplayName = 0x3001;
inline constexpr uint16_t kPidAddressType = 0x3002;
inline constexpr uint16_t kPidEmailAddress = 0x3003;
inline constexpr uint16_t kPidSmtpAddress = 0x39FE;
inline constexpr uint16_t kPidRecipientDisplayName = 0x5FF6;
inline constexpr uint16_t kPidObjectType = 0x0FFE;
inline constexpr uint16_t kPidDisplayType = 0x3900;
inline constexpr uint16_t kPidEntryId = 0x0FFF;
inline constexpr uint16_t kPidRecordKey = 0x0FF9;
inline constexpr int32_t kRecipientTo = 1;
inline constexpr int32_t kRecipientCc = 2;
inline constexpr int32_t kRecipientBcc = 3;

// Attachments.
inline constexpr uint16_t kPidAttachDataBinary = 0x3701;  // also the embedded object
inline constexpr uint16_t kPidAttachExtension = 0x3703;
inline constexpr uint16_t kPidAttachFilename = 0x3704;
inline constexpr uint16_t kPidAttachMethod = 0x3705;
inline constexpr uint16_t kPidAttachLongFilename = 0x3707;
inline constexpr uint16_t kPidAttachMimeTag = 0x370E;
inline constexpr uint16_t kPidAttachContentId = 0x3712;
inline constexpr uint16_t kPidAttachSize = 0x0E20;
inline constexpr uint16_t kPidAttachNumber = 0x0E21;
inline constexpr uint16_t kPidRenderingPosition = 0x370B;
inline constexpr uint16_t kPidAttachFlags = 0x3714;
inline constexpr int32_t kAttachByValue = 1;
inline constexpr int32_t kAttachEmbeddedMessage = 5;

// Folders.
inline constexpr uint16_t kPidContentCount = 0x3602;
inline constexpr uint16_t kPidContentUnreadCount = 0x3603;
inline constexpr uint16_t kPidSubfolders = 0x360A;
inline constexpr uint16_t kPidContainerClass = 0x3613;

// Contacts (tagged).
inline constexpr uint16_t kPidGivenName = 0x3A06;
inline constexpr uint16_t kPidSurname = 0x3A11;
inline constexpr uint16_t kPidMiddleName = 0x3A44;
inline constexpr uint16_t kPidDisplayNamePrefix = 0x3A45;
inline constexpr uint16_t kPidGeneration = 0x3A05;
inline constexpr uint16_t kPidNickname = 0x3A4F;
inline constexpr uint16_t kPidCompanyName = 0x3A16;
inline constexpr uint16_t kPidTitle = 0x3A17;
inline constexpr uint16_t kPidDepartmentName = 0x3A18;
inline constexpr uint16_t kPidBusinessTelephoneNumber = 0x3A08;
inline constexpr uint16_t kPidHomeTelephoneNumber = 0x3A09;
inline constexpr uint16_t kPidMobileTelephoneNumber = 0x3A1C;
inline constexpr uint16_t kPidBusinessFaxNumber = 0x3A24;
inline constexpr uint16_t kPidBirthday = 0x3A42;
inline constexpr uint16_t kPidWeddingAnniversary = 0x3A41;
inline constexpr uint16_t kPidGender = 0x3A4D;
inline constexpr uint16_t kPidBusinessHomePage = 0x3A51;
inline constexpr uint16_t kPidStreetAddress = 0x3A29;
inline constexpr uint16_t kPidLocality = 0x3A27;
inline constexpr uint16_t kPidStateOrProvince = 0x3A28;
inline constexpr uint16_t kPidPostalCode = 0x3A2A;
inline constexpr uint16_t kPidCountry = 0x3A26;

// Property sets ([MS-OXPROPS] 1.3.2), in on-disk byte order.
extern const Guid kPsetidCommon;       // 00062008-0000-0000-C000-000000000046
extern const Guid kPsetidAddress;      // 00062004-0000-0000-C000-000000000046
extern const Guid kPsetidAppointment;  // 00062002-0000-0000-C000-000000000046
extern const Guid kPsetidTask;         // 00062003-0000-0000-C000-000000000046
extern const Guid kPsetidLog;          // 0006200A-0000-0000-C000-000000000046
extern const Guid kPsetidNote;         // 0006200E-0000-0000-C000-000000000046
extern const Guid kPsPublicStrings;    // 00020329-0000-0000-C000-000000000046
extern const Guid kPsInternetHeaders;  // 00020386-0000-0000-C000-000000000046
extern const Guid kPsMapi;             // 00020328-0000-0000-C000-000000000046

NamedProperty NamedId(const Guid& set, uint32_t lid);
NamedProperty NamedString(const Guid& set, const std::string& name);

// Used by the import of composed files and the class fillers.
inline constexpr uint16_t kPidAlternateRecipientAllowed = 0x0002;
inline constexpr uint16_t kPidDeferredDeliveryTime = 0x000F;
inline constexpr uint16_t kPidOriginatorDeliveryReportRequested = 0x0023;
inline constexpr uint16_t kPidReadReceiptRequested = 0x0029;
inline constexpr uint16_t kPidRecipientReassignmentProhibited = 0x002B;
inline constexpr uint16_t kPidStartDate = 0x0060;
inline constexpr uint16_t kPidEndDate = 0x0061;
inline constexpr uint16_t kPidInternetReferences = 0x1039;
inline constexpr uint16_t kPidOriginalMessageId = 0x1046;
inline constexpr uint16_t kPidConversationIndexTracking = 0x3016;
inline constexpr uint16_t kPidDeferredSendTime = 0x3FEF;
inline constexpr uint16_t kPidSentRepresentingSmtpAddress = 0x5D02;
inline constexpr uint16_t kPidRecipientFlags = 0x5FFD;
inline constexpr uint16_t kPidAttachmentHidden = 0x7FFE;
inline constexpr uint16_t kPidAttachmentContactPhoto = 0x7FFF;
inline constexpr uint16_t kPidChildrensNames = 0x3A58;

// PidTagMessageFlags bits.
inline constexpr int32_t kMsgFlagRead = 0x0001;
inline constexpr int32_t kMsgFlagUnmodified = 0x0002;
inline constexpr int32_t kMsgFlagHasAttach = 0x0010;
// PidTagImportance values.
inline constexpr int32_t kImportanceLow = 0;
inline constexpr int32_t kImportanceNormal = 1;
inline constexpr int32_t kImportanceHigh = 2;
// PidTagObjectType of a recipient; PidTagRecipientFlags bits.
inline constexpr int32_t kObjectTypeMailUser = 6;
inline constexpr int32_t kRecipientFlagSendable = 0x0001;
inline constexpr int32_t kRecipientFlagOrganizer = 0x0002;

// Named properties by long id (LID), with the property set each belongs to.
// PSETID_Appointment
inline constexpr uint32_t kLidBusyStatus = 0x8205;
inline constexpr uint32_t kLidLocation = 0x8208;
inline constexpr uint32_t kLidAppointmentStartWhole = 0x820D;
inline constexpr uint32_t kLidAppointmentEndWhole = 0x820E;
inline constexpr uint32_t kLidAppointmentDuration = 0x8213;
inline constexpr uint32_t kLidAppointmentSubType = 0x8215;
inline constexpr uint32_t kLidAppointmentStateFlags = 0x8217;
inline constexpr int32_t kAppointmentStateMeeting = 0x0001;
// PSETID_Common
inline constexpr uint32_t kLidCommonStart = 0x8516;
inline constexpr uint32_t kLidCommonEnd = 0x8517;
// PSETID_Task
inline constexpr uint32_t kLidTaskStatus = 0x8101;
inline constexpr uint32_t kLidPercentComplete = 0x8102;
inline constexpr uint32_t kLidTaskStartDate = 0x8104;
inline constexpr uint32_t kLidTaskDueDate = 0x8105;
inline constexpr uint32_t kLidTaskDateCompleted = 0x810F;
inline constexpr uint32_t kLidTaskComplete = 0x811C;
inline constexpr int32_t kTaskStatusInProgress = 1;
inline constexpr int32_t kTaskStatusComplete = 2;
inline constexpr int32_t kTaskStatusWaiting = 3;
inline constexpr int32_t kTaskStatusDeferred = 4;
// PSETID_Address
inline constexpr uint32_t kLidFileUnder = 0x8005;
inline constexpr uint32_t kLidHasPicture = 0x8015;
inline constexpr uint32_t kLidHomeAddress = 0x801A;
inline constexpr uint32_t kLidWorkAddress = 0x801B;
inline constexpr uint32_t kLidOtherAddress = 0x801C;
inline constexpr uint32_t kLidAddressBookProviderEmailList = 0x8028;
inline constexpr uint32_t kLidAddressBookProviderArrayType = 0x8029;
inline constexpr uint32_t kLidWorkAddressStreet = 0x8045;
inline constexpr uint32_t kLidWorkAddressCity = 0x8046;
inline constexpr uint32_t kLidWorkAddressState = 0x8047;
inline constexpr uint32_t kLidWorkAddressPostalCode = 0x8048;
inline constexpr uint32_t kLidWorkAddressCountry = 0x8049;
inline constexpr uint32_t kLidWorkAddressPostOfficeBox = 0x804A;
inline constexpr uint32_t kLidDistributionListChecksum = 0x804C;
inline constexpr uint32_t kLidDistributionListName = 0x8053;
inline constexpr uint32_t kLidDistributionListOneOffMembers = 0x8054;
inline constexpr uint32_t kLidDistributionListMembers = 0x8055;
inline constexpr uint32_t kLidInstantMessagingAddress = 0x8062;
// Email1; Email2 and Email3 follow at +0x10 and +0x20.
inline constexpr uint32_t kLidEmail1DisplayName = 0x8080;
inline constexpr uint32_t kLidEmail1AddressType = 0x8082;
inline constexpr uint32_t kLidEmail1EmailAddress = 0x8083;
inline constexpr uint32_t kLidEmail1OriginalDisplayName = 0x8084;
inline constexpr uint32_t kLidEmail1OriginalEntryId = 0x8085;
inline constexpr uint32_t kLidEmailStride = 0x10;
inline constexpr uint32_t kLidFreeBusyLocation = 0x80D8;
inline constexpr uint32_t kLidBirthdayLocal = 0x80DE;
inline constexpr uint32_t kLidWeddingAnniversaryLocal = 0x80DF;
// PSETID_Note
inline constexpr uint32_t kLidNoteColor = 0x8B00;
inline constexpr uint32_t kLidNoteWidth = 0x8B02;
inline constexpr uint32_t kLidNoteHeight = 0x8B03;
inline constexpr uint32_t kLidNoteX = 0x8B04;
inline constexpr uint32_t kLidNoteY = 0x8B05;
// PSETID_Log
inline constexpr uint32_t kLidLogType = 0x8700;
inline constexpr uint32_t kLidLogStart = 0x8706;
inline constexpr uint32_t kLidLogDuration = 0x8707;
inline constexpr uint32_t kLidLogEnd = 0x8708;
inline constexpr uint32_t kLidLogTypeDesc = 0x8712;

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_PROPERTY_TAGS_H_
