#include "cli/terminal_progress.h"

#include <unistd.h>

#include <cstdio>

namespace tarnwell::cli {

constexpr int kBarWidth = 30;
constexpr int kPermille = 1000;

TerminalProgress::TerminalProgress() : enabled_(::isatty(STDERR_FILENO)) {}

TerminalProgress::~TerminalProgress() { Clear(); }

void TerminalProgress::Stage(const std::string& text) {
  stage_ = text;
  position_ = 0;
  Draw();
}

void TerminalProgress::Position(int thousandths) {
  if (thousandths == position_) return;
  position_ = thousandths;
  Draw();
}

void TerminalProgress::Message(const std::string& text) {
  Clear();
  std::fprintf(stderr, "%s\n", text.c_str());
  Draw();
}

void TerminalProgress::Draw() {
  if (!enabled_ || position_ < 0) return;
  const int filled = position_ * kBarWidth / kPermille;
  std::fprintf(stderr, "\r%-32.32s [%.*s%*s] %3d%%", stage_.c_str(), filled,
               "##############################", kBarWidth - filled, "", position_ / 10);
  std::fflush(stderr);
  drawn_ = true;
}

void TerminalProgress::Clear() {
  if (!enabled_ || !drawn_) return;
  std::fprintf(stderr, "\r%*s\r", kBarWidth + 42, "");
  std::fflush(stderr);
  drawn_ = false;
}

}  // namespace tarnwell::cli
