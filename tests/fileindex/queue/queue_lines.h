// Queue lines and what comes of them, as texts.

#ifndef QUARRY_TESTS_FILEINDEX_QUEUE_QUEUE_LINES_H_
#define QUARRY_TESTS_FILEINDEX_QUEUE_QUEUE_LINES_H_

#include <json/json.h>

#include <cstdint>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "common/json.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindex {

inline std::string Line(std::uint32_t event, const std::string& path,
                        const std::string& path_old = "", const Json::Value& data = Json::Value()) {
  Json::Value json;
  json["event"] = event;
  json["path"] = path;
  if (!path_old.empty()) json["path_old"] = path_old;
  if (!data.isNull()) json["data"] = data;
  return toString(json) + "\n";
}

inline std::string DirLine(std::uint32_t event, const std::string& path) {
  Json::Value json;
  json["event"] = event;
  json["path"] = path;
  json["is_dir"] = true;
  return toString(json) + "\n";
}

inline std::string RenameLine(const std::string& from, const std::string& to) {
  return Line(EVENT_RENAME, to, from);
}

inline Json::Value Parsed(const std::string& text) {
  Json::Value json;
  EXPECT_TRUE(fromString(json, text)) << text;
  return json;
}

// "kind path", "kind old -> new" for renames, and the data behind it where there is any.
inline std::string Text(const OP& op) {
  static const char* const kNames[] = {"none",   "delete", "index",   "attr",
                                       "config", "rename", "reindex", "full"};
  std::string text = std::string(kNames[op.op]) + " ";
  if (!op.src.empty()) text += op.src + " -> ";
  text += op.node->GetPath();
  if (!op.data.isNull()) text += " " + toString(op.data);
  return text;
}

inline std::vector<std::string> Texts(const std::vector<std::shared_ptr<OP>>& ops) {
  std::vector<std::string> texts;
  for (const auto& op : ops) texts.push_back(Text(*op));
  return texts;
}

inline std::vector<std::string> HandedOut(OPTree& tree) {
  std::vector<std::string> texts;
  tree.ProcessOP([&texts](std::shared_ptr<OP> op) { texts.push_back(Text(*op)); });
  return texts;
}

// A queue file with these lines, removed with the object.
class QueueFile {
 public:
  explicit QueueFile(const std::string& text = "") { test::WriteFile(path(), text); }
  std::string path() const { return dir_ / "queue"; }

 private:
  test::TempDir dir_;
};

// What is handed out for a queue of these lines.
inline std::vector<std::string> Folded(const std::string& lines) {
  const QueueFile queue(lines);
  OPTree tree(queue.path());
  return HandedOut(tree);
}

}  // namespace quarry::fileindex

#endif  // QUARRY_TESTS_FILEINDEX_QUEUE_QUEUE_LINES_H_
