// How long work reports on itself, and how it learns that the user pressed Stop.
//
// Workers never touch a user interface: they call a ProgressSink, which the
// desktop window implements with queued signals and the command line with a
// bar on stderr. Progress is counted in thousandths (0..1000).
#ifndef TARNWELL_BASE_PROGRESS_SINK_H_
#define TARNWELL_BASE_PROGRESS_SINK_H_

#include <atomic>
#include <cstdint>
#include <string>

namespace tarnwell {

class ProgressSink {
 public:
  virtual ~ProgressSink() = default;
  virtual void Stage(const std::string& /*text*/) {}
  virtual void Range(int /*low*/, int /*high*/) {}
  virtual void Position(int /*thousandths*/) {}
  virtual void ItemCount(uint64_t /*count*/) {}
  // An information message the user must see ("Error..Wrong Previous Page No.").
  virtual void Message(const std::string& /*text*/) {}
};

// A sink that drops everything; the default where nobody listens.
ProgressSink& NullProgress();

// The running flag: true = go on, false = the user asked to stop. Only the
// worker raises it again; Stop only lowers it.
using RunningFlag = std::atomic<bool>;

}  // namespace tarnwell

#endif  // TARNWELL_BASE_PROGRESS_SINK_H_
