// Carrying documents from the reader of files to the search engine, many at a time.

#ifndef QUARRY_DAEMONS_FILEINDEXD_DOCUMENT_CARRIER_H_
#define QUARRY_DAEMONS_FILEINDEXD_DOCUMENT_CARRIER_H_

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/common/client.h"
#include "daemons/fileindexd/index.h"

namespace quarry::fileindexd {

// Documents are texts of files, and are handed on as they come: nothing here reads or writes them
// again. Keeps a connection to either side. One thread at a time.
class DocumentCarrier {
 public:
  struct Sockets {
    std::string extractor;
    std::string engine;
  };

  // Nothing is connected yet. Throws Error 502 when a path does not fit a socket address.
  explicit DocumentCarrier(const Sockets& sockets);

  // Replaces the documents of these places in the index `id`. Returns for each whether that is
  // done. Nothing is tried again: whatever is in the way, the caller asks for the document by
  // itself. Asks `go_on`, which throws nothing, before each exchange, and leaves the rest undone
  // when that says no. Throws nothing.
  std::vector<bool> Carry(const std::string& id, const std::vector<Wish>& wishes,
                          const std::function<bool()>& go_on);

 private:
  void CarrySome(const std::string& id, const std::vector<Wish>& wishes, std::vector<bool>* done,
                 std::size_t* at);

  daemon::Client extractor_;
  daemon::Client engine_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_DOCUMENT_CARRIER_H_
