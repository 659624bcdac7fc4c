#include "store/item_records.h"

namespace tarnwell::store {

std::string MessageFlagsText(uint32_t flags) {
  static const char* const kTexts[] = {"Read,",       "Unmodified,", "Submit,",     "unsent,",
                                       "Attachment,", "From Me,",    "Associated,", "Resend,",
                                       "NR Pending,", "NRN pending,"};
  std::string out;
  for (unsigned bit = 0; bit < sizeof kTexts / sizeof kTexts[0]; ++bit) {
    if (flags & (1u << bit)) out += kTexts[bit];
  }
  return out;
}

}  // namespace tarnwell::store
