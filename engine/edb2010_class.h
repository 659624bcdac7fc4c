// Edb2010Class: the reader of large-page databases (Exchange 2010, 2013 and
// later: 32 KiB pages, 80-byte page headers, node flags inside the node).
#ifndef TARNWELL_ENGINE_EDB2010_CLASS_H_
#define TARNWELL_ENGINE_EDB2010_CLASS_H_

#include "engine/edb_class.h"

namespace tarnwell::engine {

class Edb2010Class : public EdbClass {
 public:
  PageFamily family() const override { return PageFamily::kLarge; }
};

}  // namespace tarnwell::engine

#endif  // TARNWELL_ENGINE_EDB2010_CLASS_H_
