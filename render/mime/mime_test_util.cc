#include "render/mime/mime_test_util.h"

#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>

#include "base/text.h"

namespace tarnwell::render::mime_testing {
namespace {

constexpr const char* kPython = "/usr/bin/python3";

// Prints one line per fact, every text as 'h' + hex of its UTF-8 so that any character
// survives the trip.
constexpr const char* kScript = R"PY(
import sys, re, email, email.policy, email.header, hashlib
def hx(s):
    return 'h' + s.encode('utf-8', 'surrogateescape').hex()
data = open(sys.argv[1], 'rb').read()
m = email.message_from_bytes(data, policy=email.policy.default)
for k, v in m.items():
    print('HEADER', hx(k), hx(str(v)))
# The older decoder follows RFC 2047 on blanks between adjacent encoded words everywhere;
# the newer one keeps them inside display names.
for k, v in m.raw_items():
    v = re.sub(r'\r?\n[ \t]', ' ', v)
    print('LEGACY', hx(k), hx(str(email.header.make_header(email.header.decode_header(v)))))
for i, p in enumerate(m.walk()):
    for d in p.defects:
        print('DEFECT', i, hx(''), hx(type(d).__name__ + ': ' + str(d)))
    for k, v in p.items():
        for d in getattr(v, 'defects', ()):
            print('DEFECT', i, hx(k), hx(type(d).__name__ + ': ' + str(d)))
    if p.is_multipart():
        print('MULTI', i, hx(p.get_content_type()))
        continue
    payload = p.get_payload(decode=True) or b''
    fn = p.get_filename()
    print('PART', i, hx(p.get_content_type()), hx(fn) if fn is not None else '-',
          hashlib.sha256(payload).hexdigest(), len(payload))
    if p.get_content_maintype() == 'text':
        try:
            print('TEXT', i, hx(p.get_content()))
        except Exception as e:
            print('DEFECT', i, hx(''), hx('get_content: ' + repr(e)))
)PY";

std::string Unhex(const std::string& token) {
  std::string out;
  for (size_t i = 1; i + 1 < token.size(); i += 2) {
    out.push_back(static_cast<char>(std::stoi(token.substr(i, 2), nullptr, 16)));
  }
  return out;
}

}  // namespace

std::optional<std::string> PythonReading::Header(const std::string& name, bool legacy) const {
  for (const auto& [key, value] : legacy ? legacy_headers : headers) {
    if (EqualsIgnoreAsciiCase(key, name)) return value;
  }
  return std::nullopt;
}

bool PythonAvailable() { return access(kPython, X_OK) == 0; }

std::string TempPath(const std::string& name) {
  static std::atomic<int> counter{0};
  std::filesystem::path dir =
      std::filesystem::path(::testing::TempDir()) / ("tarnwell_mime_" + std::to_string(getpid()));
  std::filesystem::create_directories(dir);
  return (dir / (std::to_string(counter++) + "_" + name)).string();
}

PythonReading ReadWithPython(const std::string& message) {
  PythonReading reading;
  if (!PythonAvailable()) return reading;
  reading.available = true;
  const std::string script_path = TempPath("read_eml.py");
  const std::string message_path = TempPath("message.eml");
  std::ofstream(script_path, std::ios::binary) << kScript;
  std::ofstream(message_path, std::ios::binary) << message;
  const std::string command =
      std::string(kPython) + " " + script_path + " " + message_path + " 2>&1";
  FILE* pipe = popen(command.c_str(), "r");
  if (!pipe) {
    reading.error = "popen failed";
    return reading;
  }
  std::string output;
  char buffer[4096];
  size_t got;
  while ((got = fread(buffer, 1, sizeof(buffer), pipe)) > 0) output.append(buffer, got);
  const int status = pclose(pipe);
  std::filesystem::remove(script_path);
  std::filesystem::remove(message_path);
  if (status != 0) {
    reading.error = output;
    return reading;
  }
  std::istringstream lines(output);
  std::string line;
  while (std::getline(lines, line)) {
    std::istringstream in(line);
    std::string kind;
    in >> kind;
    if (kind == "HEADER") {
      std::string name, value;
      in >> name >> value;
      reading.headers.emplace_back(Unhex(name), Unhex(value));
    } else if (kind == "LEGACY") {
      std::string name, value;
      in >> name >> value;
      reading.legacy_headers.emplace_back(Unhex(name), Unhex(value));
    } else if (kind == "DEFECT") {
      PythonDefect defect;
      std::string header, text;
      in >> defect.index >> header >> text;
      defect.header = Unhex(header);
      defect.text = Unhex(text);
      reading.defects.push_back(defect);
    } else if (kind == "MULTI") {
      int index;
      std::string type;
      in >> index >> type;
      reading.multipart_types.push_back(Unhex(type));
    } else if (kind == "PART") {
      PythonPart part;
      std::string type, name;
      in >> part.index >> type >> name >> part.sha256 >> part.size;
      part.content_type = Unhex(type);
      if (name != "-") part.file_name = Unhex(name);
      reading.parts.push_back(part);
    } else if (kind == "TEXT") {
      int index;
      std::string text;
      in >> index >> text;
      for (PythonPart& part : reading.parts) {
        if (part.index == index) part.text = Unhex(text);
      }
    } else {
      reading.error += line + "\n";
    }
  }
  return reading;
}

std::string Sha256Hex(ByteView bytes) {
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  EVP_Digest(bytes.data(), bytes.size(), digest, &length, EVP_sha256(), nullptr);
  std::string hex;
  constexpr char kDigits[] = "0123456789abcdef";
  for (unsigned int i = 0; i < length; ++i) {
    hex.push_back(kDigits[digest[i] >> 4]);
    hex.push_back(kDigits[digest[i] & 0x0F]);
  }
  return hex;
}

Bytes RandomBytes(size_t size, uint32_t seed) {
  std::mt19937 random(seed);
  Bytes out(size);
  for (auto& b : out) b = static_cast<uint8_t>(random());
  return out;
}

}  // namespace tarnwell::render::mime_testing
