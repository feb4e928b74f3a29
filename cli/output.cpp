#include "cli/output.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <iostream>

namespace quarry::cli {
namespace {

// Columns are measured in characters: UTF-8's continuation bytes take no room.
std::size_t Width(const std::string& text) {
  return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), [](char c) {
    return (static_cast<unsigned char>(c) & 0xC0U) != 0x80U;
  }));
}

std::string Format(const char* format, double value) {
  std::array<char, 64> buffer{};
  std::snprintf(buffer.data(), buffer.size(), format, value);
  return buffer.data();
}

}  // namespace

std::string Printable(const std::string& text) {
  std::string result;
  unsigned char before = 0;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    // The second byte of the controls U+0080 to U+009F; escaped, it leaves the first without one.
    const bool upper_control = before == 0xC2 && byte >= 0x80 && byte < 0xA0;
    before = byte;
    if (byte >= 0x20 && byte != 0x7F && !upper_control) {
      result += c;
      continue;
    }
    std::array<char, 8> escape{};
    std::snprintf(escape.data(), escape.size(), "\\x%02x", static_cast<unsigned>(byte));
    result += escape.data();
  }
  return result;
}

void PrintTable(std::ostream& out, const std::vector<std::vector<std::string>>& rows) {
  std::vector<std::size_t> widths;
  for (const auto& row : rows) {
    widths.resize(std::max(widths.size(), row.size()));
    for (std::size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], Width(row[i]));
  }
  for (const auto& row : rows) {
    std::string line;
    for (std::size_t i = 0; i < row.size(); ++i) {
      line += row[i];
      if (i + 1 < row.size()) line += std::string(widths[i] - Width(row[i]) + 2, ' ');
    }
    out << line << '\n';
  }
}

void PrintJson(std::ostream& out, const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  builder["precision"] = 15;  // 0.1 is to be 0.1
  out << Json::writeString(builder, value) << '\n';
}

void PrintDone(bool json, const std::string& sentence, const Json::Value& result) {
  if (json) {
    PrintJson(std::cout, result);
  } else {
    std::cout << Printable(sentence) << '\n';
  }
}

std::string HumanSize(std::uint64_t bytes) {
  static constexpr std::array<const char*, 5> kUnits{" KB", " MB", " GB", " TB", " PB"};
  if (bytes < 1024) return std::to_string(bytes) + " B";
  auto value = static_cast<double>(bytes) / 1024;
  std::size_t unit = 0;
  while (value >= 1023.95 && unit + 1 < kUnits.size()) {
    value /= 1024;
    ++unit;
  }
  return Format("%.1f", value) + kUnits[unit];
}

std::string HumanDuration(double seconds) {
  if (seconds < 9.95) return Format("%.1f s", seconds);
  const long long whole = std::llround(seconds);
  if (whole < 60) return std::to_string(whole) + " s";
  if (whole < 3600) {
    return std::to_string(whole / 60) + " min " + std::to_string(whole % 60) + " s";
  }
  return std::to_string(whole / 3600) + " h " + std::to_string(whole / 60 % 60) + " min";
}

std::string HumanTime(std::int64_t seconds) {
  const auto value = static_cast<std::time_t>(seconds);
  std::tm local{};
  std::array<char, 32> buffer{};
  if (localtime_r(&value, &local) == nullptr ||
      std::strftime(buffer.data(), buffer.size(), "%Y-%m-%d %H:%M", &local) == 0) {
    return std::to_string(seconds);
  }
  return buffer.data();
}

bool OutputIsTerminal() {
  const char* terminal = std::getenv("TERM");
  return isatty(STDOUT_FILENO) == 1 && terminal != nullptr && std::string(terminal) != "dumb";
}

}  // namespace quarry::cli
