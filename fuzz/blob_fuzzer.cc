// libFuzzer target: "PropertyBlob" values in both layouts, through the entry
// parsers and the list and detail parsers that fill item records.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "store/property_blob.h"
#include "store/property_decoder.h"
#include "store/real_property_blob.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace tarnwell;
  const ByteView blob(data, size);
  std::vector<store::BlobEntry> entries = store::ReadBlobEntries(blob);
  store::RealBlob real = store::ParseRealBlob(blob);
  volatile size_t seen = entries.size() + real.entries.size();
  (void)seen;
  store::BlobParserOptions options;
  options.later_2013_variant = size % 2 == 0;
  store::MessageSummary summary;
  store::ParseBlobForList(blob, options, &summary);
  static const store::PropertyDecoder decoder(5);
  store::ItemRecords records;
  for (store::DecodePurpose purpose :
       {store::DecodePurpose::kMessageDetail, store::DecodePurpose::kContactDetail,
        store::DecodePurpose::kAppointmentDetail, store::DecodePurpose::kTaskDetail}) {
    store::ParseBlobForDetail(decoder, purpose, blob, options, &records);
  }
  return 0;
}
