#include "engine/version.h"

namespace tarnwell::engine {
namespace {

constexpr uint32_t kLargePageThreshold = 16384;

// clang-format off
constexpr VersionInfo kVersions[] = {
  {kExchange2000, "Exchange server 2000/2003",      1, 4096,  PageFamily::kLegacy, true,  0x0803, 0x0823, 20480},
  {kExchange2007, "Exchange server 2007",           2, 8192,  PageFamily::kLegacy, true,  0x2803, 0x2823, 32768},
  {kExchange2010, "Exchange server 2010",           3, 32768, PageFamily::kLarge,  true,  0xA803, 0xA823, 32768},
  {kExchange55,   "Exchange server 5.5",            0, 4096,  PageFamily::kLegacy, false, 0,      0,      0},
  {kExchange2013, "Exchange server 2013 and above", 4, 32768, PageFamily::kLarge,  true,  0xA803, 0xA823, 0},
};
// clang-format on

}  // namespace

const VersionInfo* FindVersion(int code) {
  for (const VersionInfo& v : kVersions) {
    if (v.code == code) return &v;
  }
  return nullptr;
}

// Exchange 2013 writes revision 20; the servers after it write later ones
// (2016 and 2019 databases carry revisions past 100) in the same layout.
constexpr uint32_t kFirstModernRevision = 20;

VersionCode VersionFromRevision(uint32_t revision) {
  if (revision >= kFirstModernRevision) return kExchange2013;
  return TemplateVersionFromRevision(revision);
}

VersionCode TemplateVersionFromRevision(uint32_t revision) {
  switch (revision) {
    case 9:
      return kExchange2000;
    case 12:
      return kExchange2007;
    case 17:
      return kExchange2010;
    case 2:
      return kExchange55;
    default:
      return kVersionUnknown;
  }
}

PageFamily FamilyForPageSize(uint32_t page_size) {
  return page_size >= kLargePageThreshold ? PageFamily::kLarge : PageFamily::kLegacy;
}

bool IsValidPageSize(uint32_t page_size) {
  return page_size == 2048 || page_size == 4096 || page_size == 8192 || page_size == 16384 ||
         page_size == 32768;
}

}  // namespace tarnwell::engine
