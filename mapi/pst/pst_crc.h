// The CRC-32 that PST headers, pages and block trailers carry: the common
// reflected polynomial 0xEDB88320, but with no inversion before or after, so
// the empty input and a run of zero bytes both give the starting value.
#ifndef TARNWELL_MAPI_PST_PST_CRC_H_
#define TARNWELL_MAPI_PST_PST_CRC_H_

#include <cstdint>

#include "base/byte_view.h"

namespace tarnwell::mapi::pst {

// Continues `crc` over `data`; start with 0.
uint32_t ComputeCrc(uint32_t crc, ByteView data);

}  // namespace tarnwell::mapi::pst

#endif  // TARNWELL_MAPI_PST_PST_CRC_H_
