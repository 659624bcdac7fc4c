// The ESE database writer the tests build their Exchange databases with.
//
//   forge::DatabaseLayout layout;
//   layout.page_size = 32768;
//   layout.format_revision = 17;
//   layout.tables.push_back({"Folders", columns, rows});
//   forge::Manifest manifest;
//   Status s = forge::WriteDatabase(layout, path, &manifest);
//
// Output is deterministic: the same layout gives the same bytes.
#ifndef TARNWELL_TESTING_ESE_WRITER_H_
#define TARNWELL_TESTING_ESE_WRITER_H_

#include <string>

#include "base/byte_view.h"
#include "base/status.h"
#include "testing/forge_layout.h"

namespace tarnwell::forge {

// The page flags OR-ed into every page when the layout leaves them unset.
uint32_t DefaultPageFormatFlags(uint32_t page_size, uint32_t revision);

// Builds the database in memory. On failure returns an empty buffer and, when
// `status` is given, says why.
Bytes BuildDatabase(const DatabaseLayout& layout, Manifest* manifest = nullptr,
                    const FileDamage& damage = {}, Status* status = nullptr);

// Builds the database and writes it to `path`.
Status WriteDatabase(const DatabaseLayout& layout, const std::string& path,
                     Manifest* manifest = nullptr, const FileDamage& damage = {});

}  // namespace tarnwell::forge

#endif  // TARNWELL_TESTING_ESE_WRITER_H_
