#include "base/status.h"

namespace tarnwell {

std::string Status::ToString() const {
  switch (code_) {
    case Code::kOk:
      return "OK";
    case Code::kNotFound:
      return "Not found: " + message_;
    case Code::kCorruption:
      return "Corruption: " + message_;
    case Code::kIoError:
      return "IO error: " + message_;
    case Code::kInvalidArgument:
      return "Invalid argument: " + message_;
    case Code::kNotSupported:
      return "Not supported: " + message_;
    case Code::kCancelled:
      return "Cancelled: " + message_;
  }
  return message_;
}

}  // namespace tarnwell
