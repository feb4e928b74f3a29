// What the files of the engine and of the change monitor tell about shares and folders, when the
// lists of these are damaged.

#ifndef QUARRY_CLI_DOCTOR_KNOWN_PLACES_H_
#define QUARRY_CLI_DOCTOR_KNOWN_PLACES_H_

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

namespace quarry::cli {

// Where the engine keeps the list of its indexes, and the monitor its registrations.
const std::string& EngineListPath();
const std::string& MonitorDirectory();

// The full paths of the shares that have an index, by their names, as far as the names of the
// indexes' directories tell. A list that cannot be read gives none.
std::map<std::string, std::string> SharesWithIndex();

struct Registration {
  std::string file;                 // its path
  bool whole = false;               // whether it can be read; else nothing else is known
  std::string queue;                // the queue that it fills
  std::vector<std::string> places;  // the full paths of its directories
};

// What the library has registered. Throws Problem where that cannot be listed.
std::vector<Registration> Registrations();

}  // namespace quarry::cli

#endif  // QUARRY_CLI_DOCTOR_KNOWN_PLACES_H_
