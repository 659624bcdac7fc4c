// The database header: the first page-sized block of an ESE file, repeated
// as a shadow copy in the second block.
//
// Fields read (little-endian):
//
//   offset  width  meaning
//   0       4      checksum (XOR over the rest of the block)
//   4       4      signature 0x89ABCDEF
//   8       4      file-format version (0x620 for every Exchange since 5.5)
//   12      4      file type (0 database, 1 streaming file)
//   52      4      database state (1 just created, 2 dirty shutdown,
//                  3 clean shutdown, 4 being converted, 5 force detach)
//   216     4      engine major version of the creating build
//   224     4      engine build number
//   232     4      file-format revision (2, 9, 12, 17, 20 for Exchange)
//   236     4      page size (absent, i.e. 0, in the oldest formats)
#ifndef TARNWELL_ENGINE_DATABASE_HEADER_H_
#define TARNWELL_ENGINE_DATABASE_HEADER_H_

#include <cstdint>
#include <string>

#include "base/byte_view.h"
#include "base/status.h"

namespace tarnwell::engine {

constexpr uint32_t kDatabaseSignature = 0x89ABCDEF;
constexpr size_t kHeaderSignatureOffset = 4;
constexpr size_t kHeaderFormatVersionOffset = 8;
constexpr size_t kHeaderFileTypeOffset = 12;
constexpr size_t kHeaderStateOffset = 52;
constexpr size_t kHeaderRevisionOffset = 232;
constexpr size_t kHeaderPageSizeOffset = 236;
constexpr size_t kHeaderMinSize = 240;

struct DatabaseHeader {
  uint32_t checksum = 0;
  uint32_t signature = 0;
  uint32_t format_version = 0;
  uint32_t file_type = 0;
  uint32_t state = 0;
  uint32_t format_revision = 0;
  uint32_t page_size = 0;
};

// Decodes the header fields; Corruption when the block is too short or the
// signature is wrong (the fields read so far are still filled in).
Status DecodeDatabaseHeader(ByteView block, DatabaseHeader* header);

// "clean shutdown", "dirty shutdown", ... for the state field.
std::string DatabaseStateName(uint32_t state);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_DATABASE_HEADER_H_
