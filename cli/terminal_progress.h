// TerminalProgress: the command line's progress sink. Draws a one-line bar on
// stderr, only when stderr is a terminal, so that scripts see clean output.
#ifndef TARNWELL_CLI_TERMINAL_PROGRESS_H_
#define TARNWELL_CLI_TERMINAL_PROGRESS_H_

#include <string>

#include "base/progress_sink.h"

namespace tarnwell::cli {

class TerminalProgress : public ProgressSink {
 public:
  TerminalProgress();
  ~TerminalProgress() override;
  void Stage(const std::string& text) override;
  void Position(int thousandths) override;
  void Message(const std::string& text) override;

 private:
  void Draw();
  void Clear();
  bool enabled_;
  std::string stage_;
  int position_ = -1;
  bool drawn_ = false;
};

}  // namespace tarnwell::cli

#endif  // TARNWELL_CLI_TERMINAL_PROGRESS_H_
