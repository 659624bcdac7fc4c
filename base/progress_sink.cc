#include "base/progress_sink.h"

namespace tarnwell {

ProgressSink& NullProgress() {
  static ProgressSink sink;
  return sink;
}

}  // namespace tarnwell
