// Reading an index through, to find damage before somebody meets it.

#include "daemons/tarnelasticd/engine.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/request.h"

namespace quarry::engine {
namespace {

// The structure of every page; a reader's statements stop at its deadline.
void CheckPages(Database* db) {
  Statement check = db->Prepare("PRAGMA quick_check(1)");
  if (!check.Step() || check.Text(0) == "ok") return;
  const std::string report(check.Text(0));
  // The lines before the last one name the database.
  const std::string finding = report.substr(report.rfind('\n') + 1);
  throw Error(kDamagedIndex, "The index's database is damaged: " + finding);
}

}  // namespace

Json::Value Engine::IndexCheck(const Json::Value& data) {
  const std::shared_ptr<Index> index = catalog_.Find(NameProperty(data, "id"));
  try {
    Index::Access access(index.get(), /*wait=*/false);
    // What was met at work may be inside of pages that look sound.
    if (const auto problem = index->Problem()) throw Error(*problem);
    const ReaderPool::Lease reader = access.TakeReader();
    // What it remembers of the file hides what has become of it.
    reader->db().Execute("PRAGMA shrink_memory");
    reader->Begin(std::chrono::steady_clock::now() + options_.search_time);
    CheckPages(&reader->db());
  } catch (const Error& error) {
    index->NoteDamage(error);
    throw;
  }
  return {};
}

}  // namespace quarry::engine
