// Exchange versions and the page-format family each one is read with.
//
// A version code is chosen by the user or detected from the database header's
// file-format revision. It fixes the page size Exchange used, the reader class
// (legacy 40-byte page headers or large 80-byte page headers), the page flags
// the adjustment probe looks for and where the whole-file page scan starts.
#ifndef TARNWELL_ENGINE_VERSION_H_
#define TARNWELL_ENGINE_VERSION_H_

#include <cstdint>
#include <string>

namespace tarnwell::engine {

// The codes are the program's historical numbering, not chronological.
enum VersionCode : int {
  kVersionUnknown = 0,
  kExchange2000 = 1,  // Exchange 2000/2003
  kExchange2007 = 2,
  kExchange2010 = 3,
  kExchange55 = 4,
  kExchange2013 = 5,  // Exchange 2013 and above
};

enum class PageFamily {
  kLegacy,  // 40-byte page header, 13-bit tag offsets, node flags in the tag
  kLarge,   // 80-byte page header, 15-bit tag offsets, node flags in the node
};

struct VersionInfo {
  VersionCode code;
  const char* name;  // as the version chooser lists it
  int combo_index;   // position in the version chooser
  uint32_t page_size;
  PageFamily family;
  bool has_probe;              // whether the adjustment probe runs for this version
  uint32_t probe_root_flags;   // flags of page 1, the database root
  uint32_t probe_space_flags;  // flags of pages 2 and 3, its space trees
  uint32_t scan_skip;          // bytes after the database start that the page scan skips
};

// Information on a version code; nullptr for codes outside 1..5.
const VersionInfo* FindVersion(int code);

// Maps the header's file-format revision to a version code (0 when unknown).
VersionCode VersionFromRevision(uint32_t revision);
// The same for a deep-mode template database, which knows no revision 20.
VersionCode TemplateVersionFromRevision(uint32_t revision);

// The family a generic ESE file of this page size is read with.
PageFamily FamilyForPageSize(uint32_t page_size);

bool IsValidPageSize(uint32_t page_size);

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_VERSION_H_
