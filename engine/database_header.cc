#include "engine/database_header.h"

#include <cstdio>

namespace tarnwell::engine {

Status DecodeDatabaseHeader(ByteView block, DatabaseHeader* header) {
  *header = DatabaseHeader();
  if (!block.Has(0, kHeaderMinSize)) {
    return Status::Corruption("file too short for a database header");
  }
  header->checksum = block.U32LE(0);
  header->signature = block.U32LE(kHeaderSignatureOffset);
  header->format_version = block.U32LE(kHeaderFormatVersionOffset);
  header->file_type = block.U32LE(kHeaderFileTypeOffset);
  header->state = block.U32LE(kHeaderStateOffset);
  header->format_revision = block.U32LE(kHeaderRevisionOffset);
  header->page_size = block.U32LE(kHeaderPageSizeOffset);
  if (header->signature != kDatabaseSignature) {
    char buf[64];
    std::snprintf(buf, sizeof buf, "wrong signature 0x%08X (expected 0x%08X)", header->signature,
                  kDatabaseSignature);
    return Status::Corruption(buf);
  }
  return Status::Ok();
}

std::string DatabaseStateName(uint32_t state) {
  switch (state) {
    case 1:
      return "just created";
    case 2:
      return "dirty shutdown";
    case 3:
      return "clean shutdown";
    case 4:
      return "being converted";
    case 5:
      return "force detach";
    default:
      return "unknown (" + std::to_string(state) + ")";
  }
}

}  // namespace tarnwell::engine
