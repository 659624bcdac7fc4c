// Record splitting and column decoding. The first input byte picks the
// tagged-value form; the rest is one record, split by the fixed table of
// fuzz_columns.h, and every slot is decoded (separated values find no
// long-value tree).
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "engine/column_decoder.h"
#include "engine/record_columns.h"
#include "fuzz/fuzz_columns.h"

namespace {

using namespace tarnwell;
using namespace tarnwell::engine;

constexpr TaggedForm kForms[] = {TaggedForm::kSmallPageArray, TaggedForm::kLargePageArray,
                                 TaggedForm::kInline};

std::vector<CatalogEntry> MakeColumns() {
  std::vector<CatalogEntry> columns;
  for (const fuzz::FuzzColumn& c : fuzz::kFuzzColumns) {
    CatalogEntry e;
    e.type = kCatalogColumn;
    e.id = c.id;
    e.name = c.name;
    e.column_type_or_root = c.type;
    e.size = c.size;
    e.code_page = c.code_page;
    columns.push_back(e);
  }
  return columns;
}

size_t Weigh(const DecodedColumn& d) {
  size_t n = d.text.size() + d.bytes.size();
  for (const DecodedColumn& v : d.values) n += Weigh(v);
  return n;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) return 0;
  static const std::vector<CatalogEntry> kColumns = MakeColumns();
  std::vector<const CatalogEntry*> pointers;
  for (const CatalogEntry& c : kColumns) pointers.push_back(&c);
  const TaggedForm form = kForms[data[0] % std::size(kForms)];
  const ByteView record(data + 1, size - 1);

  RecordColumns columns;
  const bool split = columns.Split(record, pointers, form);
  if (split != (record.size() >= kRecordHeaderSize)) std::abort();
  if (columns.size() != kColumns.size()) std::abort();

  // Reading every value byte lets the sanitizer catch a value that reaches
  // past the record's copy.
  const ColumnDecoder decoder(nullptr, 0);
  volatile size_t sink = 0;
  for (size_t i = 0; i < columns.size(); ++i) {
    const ColumnValue& v = columns.at(i);
    if (v.value.size() > record.size()) std::abort();
    for (size_t k = 0; k < v.value.size(); ++k) sink = sink + v.value[k];
    const DecodedColumn d = decoder.Decode(kColumns[i], v);
    sink = sink + Weigh(d);
    uint8_t u8;
    uint16_t u16;
    uint32_t u32;
    uint64_t u64;
    float f;
    double dbl;
    sink = sink + columns.GetU8(i, &u8) + columns.GetU16(i, &u16) + columns.GetU32(i, &u32) +
           columns.GetU64(i, &u64) + columns.GetFloat(i, &f) + columns.GetDouble(i, &dbl);
  }
  // A slot past the table is empty, never read.
  if (columns.at(columns.size()).present) std::abort();
  return 0;
}
