// Status: the result of an operation that can fail, with a message for the user.
// Modelled on LevelDB's Status: cheap to return, says what went wrong in words.
#ifndef TARNWELL_BASE_STATUS_H_
#define TARNWELL_BASE_STATUS_H_

#include <string>
#include <utility>

namespace tarnwell {

class Status {
 public:
  enum class Code {
    kOk,
    kNotFound,
    kCorruption,
    kIoError,
    kInvalidArgument,
    kNotSupported,
    kCancelled
  };

  Status() = default;
  static Status Ok() { return Status(); }
  static Status NotFound(std::string msg) { return Status(Code::kNotFound, std::move(msg)); }
  static Status Corruption(std::string msg) { return Status(Code::kCorruption, std::move(msg)); }
  static Status IoError(std::string msg) { return Status(Code::kIoError, std::move(msg)); }
  static Status InvalidArgument(std::string msg) {
    return Status(Code::kInvalidArgument, std::move(msg));
  }
  static Status NotSupported(std::string msg) {
    return Status(Code::kNotSupported, std::move(msg));
  }
  static Status Cancelled(std::string msg) { return Status(Code::kCancelled, std::move(msg)); }

  bool ok() const { return code_ == Code::kOk; }
  Code code() const { return code_; }
  const std::string& message() const { return message_; }
  std::string ToString() const;

 private:
  Status(Code code, std::string msg) : code_(code), message_(std::move(msg)) {}
  Code code_ = Code::kOk;
  std::string message_;
};

}  // namespace tarnwell

#endif  // TARNWELL_BASE_STATUS_H_
