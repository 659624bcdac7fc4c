// The ESE database writer the tests build their Exchange databases with.
//
//   forge::DatabaseSpec spec;
//   spec.page_size = 32768;
//   spec.format_revision = 17;
//   spec.tables.push_back({"Folders", columns, rows});
//   forge::Manifest manifest;
//   Status s = forge::WriteDatabase(spec, path, &manifest);
//
// Output is deterministic: the same spec gives the same bytes.
#ifndef TARNWELL_TESTING_ESE_WRITER_H_
#define TARNWELL_TESTING_ESE_WRITER_H_

#include <string>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_spec.h"

namespace tarnwell::forge {

// The page flags OR-ed into every page when the spec leaves them unset.
uint32_t DefaultPageFormatFlags(uint32_t page_size, uint32_t revision);

// Builds the database in memory. On failure returns an empty buffer and, when
// `status` is given, says why.
Bytes BuildDatabase(const DatabaseSpec& spec, Manifest* manifest = nullptr,
                    const DamageSpec& damage = {}, Status* status = nullptr);

// Builds the database and writes it to `path`.
Status WriteDatabase(const DatabaseSpec& spec, const std::string& path,
                     Manifest* manifest = nullptr, const DamageSpec& damage = {});

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_ESE_WRITER_H_
