// The column table the record fuzzer splits records by, shared with the
// seed-corpus generator so that its seed records match the fuzzer's table.
//
// One column of every engine type: fixed ids 1..12, variable ids 128..130,
// tagged ids from 256 on (including types this program does not read, which
// must still be stepped over).
#ifndef TARNWELL_FUZZ_FUZZ_COLUMNS_H_
#define TARNWELL_FUZZ_FUZZ_COLUMNS_H_

#include <cstdint>

#include "engine/catalog_entry.h"

namespace tarnwell::fuzz {

struct FuzzColumn {
  uint32_t id;
  const char* name;
  uint32_t type;
  uint32_t size;
  uint32_t code_page;
};

constexpr uint32_t kWestern = 1252;
constexpr uint32_t kUtf16 = 1200;
constexpr uint32_t kVariableMax = 255;

inline constexpr FuzzColumn kFuzzColumns[] = {
    {1, "Flag", engine::kColumnBit, 1, 0},
    {2, "Small", engine::kColumnUnsignedByte, 1, 0},
    {3, "Short", engine::kColumnShort, 2, 0},
    {4, "Long", engine::kColumnLong, 4, 0},
    {5, "Money", engine::kColumnCurrency, 8, 0},
    {6, "Single", engine::kColumnFloat, 4, 0},
    {7, "Double", engine::kColumnDouble, 8, 0},
    {8, "When", engine::kColumnDateTime, 8, 0},
    {9, "Unsigned", engine::kColumnUnsignedLong, 4, 0},
    {10, "LongLong", engine::kColumnLongLong, 8, 0},
    {11, "Guid", engine::kColumnGuid, 16, 0},
    {12, "UShort", engine::kColumnUnsignedShort, 2, 0},
    {128, "Name", engine::kColumnText, kVariableMax, kWestern},
    {129, "Blob", engine::kColumnBinary, kVariableMax, 0},
    {130, "Subject", engine::kColumnText, kVariableMax, kUtf16},
    {256, "Body", engine::kColumnLongText, 0, kUtf16},
    {257, "Data", engine::kColumnLongBinary, 0, 0},
    {258, "Ascii", engine::kColumnLongText, 0, kWestern},
    {259, "Ids", engine::kColumnUnsignedLong, 4, 0},
    {260, "Stamp", engine::kColumnDateTime, 8, 0},
    {261, "Legacy", engine::kColumnSLV, 0, 0},
    {262, "Nothing", engine::kColumnNil, 0, 0},
    {263, "Key", engine::kColumnGuid, 16, 0},
};

}  // namespace tarnwell::fuzz

#endif  // TARNWELL_FUZZ_FUZZ_COLUMNS_H_
