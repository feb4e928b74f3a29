// How often the documents of one index have a word.

#ifndef QUARRY_DAEMONS_TARNELASTICD_FREQUENCIES_H_
#define QUARRY_DAEMONS_TARNELASTICD_FREQUENCIES_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "daemons/tarnelasticd/doc_set.h"

namespace quarry::engine {

// A number per row id: ids are small and dense.
class Frequencies {
 public:
  // Throws as DocSet::Add() does.
  void Add(std::int64_t id, float frequency) {
    CheckId(id);
    const auto index = static_cast<std::size_t>(id);
    if (index >= all_.size()) all_.resize(std::max(index + 1, all_.size() * 3 / 2));
    all_[index] += frequency;
  }

  // The same, in place of what there was.
  void Set(std::int64_t id, float frequency) {
    const auto index = static_cast<std::size_t>(id);
    if (index < all_.size()) {
      all_[index] = frequency;
    } else if (frequency > 0) {
      Add(id, frequency);
    }
  }

  float Of(std::int64_t id) const {
    const auto index = static_cast<std::size_t>(id);
    return index < all_.size() ? all_[index] : 0;
  }

  // All with more than 0.
  DocSet Documents() const {
    DocSet documents;
    for (std::size_t i = 0; i < all_.size(); ++i) {
      if (all_[i] > 0) documents.Add(static_cast<std::int64_t>(i));
    }
    return documents;
  }

  std::size_t Bytes() const { return all_.capacity() * sizeof(float); }

 private:
  std::vector<float> all_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_FREQUENCIES_H_
