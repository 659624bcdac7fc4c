// JsonWriter: builds compact JSON text for the command line's --json output.
// Strings are expected as UTF-8; control characters and quotes are escaped.
#ifndef TARNWELL_BASE_JSON_WRITER_H_
#define TARNWELL_BASE_JSON_WRITER_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace tarnwell {

class JsonWriter {
 public:
  JsonWriter& BeginObject();
  JsonWriter& EndObject();
  JsonWriter& BeginArray();
  JsonWriter& EndArray();
  JsonWriter& Key(std::string_view key);
  JsonWriter& String(std::string_view value);
  // A string the caller knows needs no escaping (hexadecimal, plain ASCII
  // names): written as is.
  JsonWriter& PlainString(std::string_view value);
  JsonWriter& Int(int64_t value);
  JsonWriter& Uint(uint64_t value);
  JsonWriter& Double(double value);
  JsonWriter& Bool(bool value);
  JsonWriter& Null();

  const std::string& str() const { return out_; }

 private:
  void BeforeValue();
  std::string out_;
  // Per open container: whether it already holds an element.
  std::vector<bool> has_element_;
  bool after_key_ = false;
};

std::string JsonEscape(std::string_view text);

}  // namespace tarnwell

#endif  // TARNWELL_BASE_JSON_WRITER_H_
