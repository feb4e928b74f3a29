#include "daemons/fileindexd/document_carrier.h"

#include <json/json.h>

#include <chrono>
#include <exception>
#include <map>
#include <optional>
#include <utility>

#include "comm/elastic_control.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "daemons/common/json_pieces.h"

namespace quarry::fileindexd {
namespace {

namespace elastic = fileindex::elastic;

// The engine may take long, and is asked anew, document by document, afterwards.
constexpr std::chrono::minutes kTimeout(10);

daemon::ClientOptions Options() {
  daemon::ClientOptions options;
  options.timeout = kTimeout;
  return options;
}

std::string Quoted(const std::string& text) {
  return toString(Json::Value(text));
}

std::string ReadRequest(const std::vector<Wish>& wishes, std::size_t begin) {
  Json::Value request;
  request["command"] = "parse_many";
  Json::Value& files = request["data"]["files"];
  for (std::size_t i = begin; i < wishes.size(); ++i) {
    Json::Value file;
    file["path"] = wishes[i].path;
    file["options"][elastic::kOptionNeedMeta] = wishes[i].need_meta;
    files.append(std::move(file));
  }
  return toString(request);
}

// The texts of the documents that the answer holds; "null" for one that cannot be had. Throws
// Error 914 for any other answer.
std::vector<std::string_view> DocumentsOf(std::string_view reply) {
  const auto members = daemon::MembersOf(reply);
  const auto data = members ? members->find("data") : decltype(members->end()){};
  if (members && data != members->end()) {
    if (auto documents = daemon::ElementsOf(data->second)) return *std::move(documents);
  }
  throw Error(kErrorParseDocument, "The reader's answer is malformed");
}

// Whether it is the document of that place: should answers ever get out of step with what is asked,
// none is to be stored in another's place.
bool IsDocumentOf(std::string_view text, const std::string& path) {
  const auto members = daemon::MembersOf(text);
  if (!members) return false;
  const auto told = members->find(elastic::kFieldPath);
  return told != members->end() && told->second == Quoted(path);
}

// Has also the field that the engine wants besides what the reader knows. Of two of one name the
// last counts.
void AppendUpsert(const std::string& id, const std::string& path, std::string_view document,
                  std::string* out) {
  if (out->back() != '[') *out += ',';
  *out += R"({"command":"document_upsert_by_id","data":{"id":)" + Quoted(id) + R"(,"doc_id":)" +
          Quoted(path) + R"(,"data":)";
  out->append(document.substr(0, document.size() - 1));
  *out +=
      std::string(",\"") + elastic::kFieldSearchFileName + "\":" + Quoted(Basename(path)) + "}}}";
}

}  // namespace

DocumentCarrier::DocumentCarrier(const Sockets& sockets)
    : extractor_("The content extractor (tarncontentextractd)", sockets.extractor, Options()),
      engine_("The search engine (tarnelasticd)", sockets.engine, Options()) {}

// Goes on behind the last document that the reader had ready.
void DocumentCarrier::CarrySome(const std::string& id, const std::vector<Wish>& wishes,
                                std::vector<bool>* done, std::size_t* at) {
  const std::string read = extractor_.RequestText(ReadRequest(wishes, *at));
  const std::vector<std::string_view> documents = DocumentsOf(read);
  if (documents.empty() || documents.size() > wishes.size() - *at) {
    throw Error(kErrorParseDocument, "The reader's answer is malformed");
  }
  std::string batch = R"({"compound":[)";
  batch.reserve(read.size() + 1024 * documents.size());
  std::vector<std::size_t> sent;
  for (const std::string_view document : documents) {
    if (IsDocumentOf(document, wishes[*at].path)) {
      AppendUpsert(id, wishes[*at].path, document, &batch);
      sent.push_back(*at);
    }
    ++*at;
  }
  if (sent.empty()) return;
  Json::Value answer;
  if (!fromString(answer, engine_.RequestText(std::move(batch += "]}")))) return;
  const Json::Value& answers = isObject(answer) ? answer["data"] : answer;
  if (!answers.isArray() || answers.size() != sent.size()) return;
  for (Json::ArrayIndex i = 0; i < answers.size(); ++i) {
    bool success = false;
    GetJsonValue(success, answers[i], "success", true);
    done->at(sent[i]) = success;
  }
}

std::vector<bool> DocumentCarrier::Carry(const std::string& id, const std::vector<Wish>& wishes,
                                         const std::function<bool()>& go_on) {
  std::vector<bool> done(wishes.size(), false);
  try {
    for (std::size_t at = 0; at < wishes.size() && go_on();) CarrySome(id, wishes, &done, &at);
  } catch (const std::exception&) {
    // What is not done is asked for again, and then it shows what is wrong.
  }
  return done;
}

}  // namespace quarry::fileindexd
