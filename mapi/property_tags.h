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

}  // namespace tarnwell::mapi

#endif  // TARNWELL_MAPI_PROPERTY_TAGS_H_
