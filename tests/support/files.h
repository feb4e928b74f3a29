// Small helpers around files and waiting. Each throws std::runtime_error on failure.

#ifndef QUARRY_TESTS_SUPPORT_FILES_H_
#define QUARRY_TESTS_SUPPORT_FILES_H_

#include <chrono>
#include <functional>
#include <string>
#include <vector>

namespace quarry::test {

std::string ReadFile(const std::string& path);
// Makes missing parent directories.
void WriteFile(const std::string& path, const std::string& text);
void MakeDirs(const std::string& path);
// The permission bits, links followed.
unsigned int FileMode(const std::string& path);
// The names in a directory, sorted.
std::vector<std::string> ListDir(const std::string& path);

// Asks again and again until `condition` holds or the deadline is over; returns what it said last.
bool WaitUntil(const std::function<bool()>& condition,
               std::chrono::milliseconds deadline = std::chrono::seconds(20));

}  // namespace quarry::test

#endif  // QUARRY_TESTS_SUPPORT_FILES_H_
