// Printing for people: tables, sizes, times, text that is safe on a terminal.

#ifndef QUARRY_CLI_OUTPUT_H_
#define QUARRY_CLI_OUTPUT_H_

#include <json/json.h>

#include <cstdint>
#include <iosfwd>
#include <string>
#include <vector>

namespace quarry::cli {

// `text` with control characters written as escapes, so that a file name cannot steer a terminal.
// Bytes that are not UTF-8 are kept.
std::string Printable(const std::string& text);

// Rows of cells in columns, two blanks apart, the first row a heading.
void PrintTable(std::ostream& out, const std::vector<std::vector<std::string>>& rows);

// What a command has done: the sentence for a person, or with `json` the result.
void PrintDone(bool json, const std::string& sentence, const Json::Value& result);

// The document with line breaks and indentation, and a newline at its end.
void PrintJson(std::ostream& out, const Json::Value& value);

// "17 B", "2.1 KB", "3.4 GB" (powers of 1024).
std::string HumanSize(std::uint64_t bytes);

// "0.8 s", "42 s", "3 min 20 s", "2 h 5 min".
std::string HumanDuration(double seconds);

// The local date and time of `seconds` since the epoch, "2026-01-31 12:00".
std::string HumanTime(std::int64_t seconds);

// Whether standard output is a terminal that may be written to with colours and moving lines.
bool OutputIsTerminal();

}  // namespace quarry::cli

#endif  // QUARRY_CLI_OUTPUT_H_
