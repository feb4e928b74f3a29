#include "tests/daemons/tarncontentextractd/support/extract_support.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unicode/ucnv.h>
#include <unicode/ustring.h>

#include <algorithm>
#include <fstream>
#include <stdexcept>

#include "daemons/tarncontentextractd/worker.h"

namespace quarry::extract {

Fields ToMap(const std::vector<Field>& fields) {
  Fields map;
  for (const Field& field : fields) {
    const auto* text = std::get_if<std::string>(&field.value);
    const auto* whole = std::get_if<std::int64_t>(&field.value);
    map[field.name] = text != nullptr    ? *text
                      : whole != nullptr ? std::to_string(*whole)
                                         : std::to_string(std::get<double>(field.value));
  }
  return map;
}

Fields ExtractBytes(const std::string& bytes, const std::string& extension) {
  Source source = Source::OfBytes(bytes, extension);
  return ToMap(ParseFile(StandardRegistry(), source));
}

std::string TextOf(const std::string& bytes, const std::string& extension) {
  return ExtractBytes(bytes, extension)["TARNMDTextContent"];
}

std::string Encode(const std::string& utf8, const std::string& charset) {
  UErrorCode status = U_ZERO_ERROR;
  std::string out(utf8.size() * 4 + 16, '\0');
  const std::int32_t size =
      ucnv_convert(charset.c_str(), "UTF-8", out.data(), static_cast<std::int32_t>(out.size()),
                   utf8.data(), static_cast<std::int32_t>(utf8.size()), &status);
  EXPECT_TRUE(U_SUCCESS(status)) << charset << ": " << u_errorName(status);
  out.resize(static_cast<std::size_t>(size));
  return out;
}

bool IsValidUtf8(const std::string& text) {
  UErrorCode status = U_ZERO_ERROR;
  std::int32_t size = 0;
  u_strFromUTF8(nullptr, 0, &size, text.data(), static_cast<std::int32_t>(text.size()), &status);
  return status == U_ZERO_ERROR || status == U_BUFFER_OVERFLOW_ERROR ||
         status == U_STRING_NOT_TERMINATED_WARNING;
}

UniqueFd OpenToRead(const std::string& path) {
  UniqueFd file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file.valid()) throw std::runtime_error("cannot open " + path);
  return file;
}

std::vector<std::string> HostileWorker(const std::string& mode) {
  return {QUARRY_HOSTILE_WORKER, mode};
}

std::vector<std::string> RealWorker() {
  return {QUARRY_EXTRACTOR, "--worker"};
}

std::string ProcessStatus(pid_t pid, const std::string& key) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.compare(0, key.size() + 1, key + ":") != 0) continue;
    return line.substr(std::min(line.find_first_not_of(" \t", key.size() + 1), line.size()));
  }
  return std::string();
}

}  // namespace quarry::extract
