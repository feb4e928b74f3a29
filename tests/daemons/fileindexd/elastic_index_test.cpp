#include "daemons/fileindexd/elastic_index.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>

#include "common/error.h"
#include "common/json.h"
#include "tests/daemons/common/harness.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::fileindexd {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

// An engine that answers what it is told to and keeps what it was asked.
class ScriptedEngine {
 public:
  explicit ScriptedEngine(const std::string& path)
      : server_(path,
                [this](const std::string& request, const daemon::Peer&) { return Take(request); }) {
  }

  void Answer(const std::string& text) {
    const std::lock_guard<std::mutex> lock(mutex_);
    answers_.push_back(text);
  }
  std::size_t ConnectionCount() const { return server_.ConnectionCount(); }
  std::vector<std::string> Asked() {
    const std::lock_guard<std::mutex> lock(mutex_);
    return std::exchange(asked_, {});
  }

 private:
  std::string Take(const std::string& request) {
    const std::lock_guard<std::mutex> lock(mutex_);
    asked_.push_back(request);
    if (answers_.empty()) return "{\"success\":true}";
    std::string answer = answers_.front();
    answers_.pop_front();
    return answer;
  }

  std::mutex mutex_;
  std::deque<std::string> answers_;
  std::vector<std::string> asked_;
  test::ServerThread server_;
};

class ElasticIndexTest : public ::testing::Test {
 protected:
  void SetUp() override {
    test::ResetTestRoot();
    engine_ = std::make_unique<ScriptedEngine>(EngineSocketPath());
  }

  int CodeOf(const std::function<void()>& call) {
    try {
      call();
    } catch (const Error& error) {
      return error.code();
    }
    return 0;
  }

  std::unique_ptr<ScriptedEngine> engine_;
  Gate gate_;
  ElasticIndex index_{"photo", gate_};
};

TEST_F(ElasticIndexTest, AsksForTheEpoch) {
  engine_->Answer(R"({"success":true,"data":{"epoch":"abc","indexes":[]}})");
  EXPECT_EQ("abc", index_.Epoch());
  EXPECT_THAT(engine_->Asked(), ElementsAre(R"({"command":"engine_status","data":{}})"));
}

TEST_F(ElasticIndexTest, CountsItsOwnDocuments) {
  const char* const answer =
      R"({"success":true,"data":{"epoch":"e","indexes":[{"id":"fileindex_x","documents":7},)"
      R"({"id":"fileindex_photo","documents":4294967296}]}})";
  engine_->Answer(answer);
  EXPECT_EQ(std::uint64_t{1} << 32, index_.Count());
  engine_->Answer(R"({"success":true,"data":{"epoch":"e","indexes":[]}})");
  EXPECT_EQ(0U, index_.Count());
}

TEST_F(ElasticIndexTest, AnAnswerOfTheWrongShapeIsAnErrorAndNothingElse) {
  for (const char* data : {"null", "7", "[]", "{}", R"({"epoch":[]})", R"({"indexes":null})"}) {
    const std::string answer = std::string(R"({"success":true,"data":)") + data + "}";
    engine_->Answer(answer);
    EXPECT_NE(0, CodeOf([this] { index_.Epoch(); })) << data;
  }
  for (const char* indexes : {"[7]", "[{}]", R"([{"id":[],"documents":1}])",
                              R"([{"id":"fileindex_photo","documents":"many"}])"}) {
    const std::string answer =
        std::string(R"({"success":true,"data":{"indexes":)") + indexes + "}}";
    engine_->Answer(answer);
    EXPECT_EQ(120, CodeOf([this] { index_.Count(); })) << indexes;
  }
  for (const char* data : {"null", "7", "{}", "\"text\""}) {
    const std::string answer = std::string(R"({"success":true,"data":)") + data + "}";
    engine_->Answer(answer);
    EXPECT_EQ(916, CodeOf([this] { index_.Find("/v/a"); })) << data;
  }
  for (const char* element : {"7", "null", "[]", "{}", R"({"TARNMDPath":[]})"}) {
    const std::string answer = std::string(R"({"success":true,"data":[)") + element + "]}";
    engine_->Answer(answer);
    EXPECT_EQ(120, CodeOf([this] { index_.Find("/v/a"); })) << element;
  }
}

TEST_F(ElasticIndexTest, FindsOneDocument) {
  engine_->Answer(R"({"success":true,"data":[{"TARNMDPath":"/v/a","TARNMDIsDir":true,)"
                  R"("QuarryAttributeStamp":"1:2:3:4:5","QuarryContentStamp":"1:3:4"}]})");
  const std::optional<Document> document = index_.Find("/v/a");
  ASSERT_TRUE(document);
  EXPECT_EQ("/v/a", document->path);
  EXPECT_TRUE(document->is_dir);
  EXPECT_EQ("1:2:3:4:5", document->attribute_stamp);
  EXPECT_EQ("1:3:4", document->content_stamp);
  EXPECT_THAT(
      engine_->Asked(),
      ElementsAre(
          R"({"command":"document_get_by_query","data":{"id":"fileindex_photo","query":{"limit":1,)"
          R"("load_field":["TARNMDPath","TARNMDIsDir","QuarryAttributeStamp","QuarryContentStamp"],)"
          R"("qsl":{"term":{"TARNMDPath":"/v/a"}}}}})"));
  engine_->Answer(R"({"success":true,"data":[]})");
  EXPECT_FALSE(index_.Find("/v/a"));
}

TEST_F(ElasticIndexTest, StampsMayBeMissing) {
  engine_->Answer(R"({"success":true,"data":[{"TARNMDPath":"/v/a"}]})");
  const std::optional<Document> document = index_.Find("/v/a");
  ASSERT_TRUE(document);
  EXPECT_FALSE(document->is_dir);
  EXPECT_EQ("", document->attribute_stamp);
  EXPECT_EQ("", document->content_stamp);
}

TEST_F(ElasticIndexTest, AsksForPagesOfChildrenAndPaths) {
  engine_->Answer(R"({"success":true,"data":[{"TARNMDPath":"/v/d/b"},{"TARNMDPath":"/v/d/c"}]})");
  EXPECT_EQ(2U, index_.Children("/v/d", "/v/d/a", 50).size());
  engine_->Answer(R"({"success":true,"data":[{"TARNMDPath":"/v/d/e/f"}]})");
  EXPECT_THAT(index_.PathsBelow("/v/d", "", 9), ElementsAre("/v/d/e/f"));
  const std::vector<std::string> asked = engine_->Asked();
  ASSERT_EQ(2U, asked.size());
  EXPECT_THAT(asked[0], HasSubstr(R"("after":"/v/d/a")"));
  EXPECT_THAT(asked[0], HasSubstr(R"("limit":50)"));
  EXPECT_THAT(asked[0], HasSubstr(R"("qsl":{"term":{"TARNMDParent":"/v/d"}})"));
  EXPECT_THAT(asked[1], HasSubstr(R"("qsl":{"prefix":{"TARNMDPath":"/v/d/"}})"));
  EXPECT_THAT(asked[1], ::testing::Not(HasSubstr("after")));
}

TEST_F(ElasticIndexTest, SendsTheLibrarysCommands) {
  index_.Delete("/v/a");
  index_.DeleteBelow("/v/a");
  index_.Commit();
  const std::vector<std::string> asked = engine_->Asked();
  ASSERT_EQ(3U, asked.size());
  EXPECT_THAT(asked[0], HasSubstr(R"("command":"document_del_by_id")"));
  EXPECT_THAT(asked[1], HasSubstr(R"("prefix":{"TARNMDPath":"/v/a/"})"));
  EXPECT_EQ(R"({"command":"commit","data":{"id":"fileindex_photo"}})", asked[2]);
}

TEST_F(ElasticIndexTest, RefusalsKeepTheirCode) {
  engine_->Answer(R"({"success":false,"error":{"code":1404,"msg":"no such index"}})");
  EXPECT_EQ(1404, CodeOf([this] { index_.Delete("/v/a"); }));
}

TEST_F(ElasticIndexTest, AnEngineThatDoesNotRunIsNotWaitedFor) {
  engine_.reset();
  for (const auto& call : std::vector<std::function<void()>>{
           [this] { index_.Epoch(); }, [this] { index_.Count(); }, [this] { index_.Commit(); },
           [this] { index_.Create(); }, [this] { index_.Delete("/v/a"); },
           [this] { index_.Find("/v/a"); }}) {
    try {
      call();
      ADD_FAILURE();
    } catch (const Error& error) {
      EXPECT_EQ(913, error.code());
      EXPECT_EQ("The search engine (tarnelasticd) is not running", error.reason());
    }
  }
}

constexpr char kBusy[] = R"({"success":false,"error":{"code":1400,"msg":"busy"}})";

TEST_F(ElasticIndexTest, ABusyEngineIsAskedAgainSoon) {
  engine_->Answer(kBusy);
  index_.Delete("/v/a");
  EXPECT_EQ(2U, engine_->Asked().size());
}

constexpr char kNone[] = R"({"success":true,"data":[]})";

TEST_F(ElasticIndexTest, AQuestionIsAskedAgainWhileTheEngineIsBusy) {
  engine_->Answer(kBusy);
  engine_->Answer(kNone);
  EXPECT_FALSE(index_.Find("/v/a"));
  EXPECT_EQ(engine_->Asked().size(), 2U);
}

TEST_F(ElasticIndexTest, ARefusedQuestionSaysWhy) {
  engine_->Answer(R"({"success":false,"error":{"code":1403,"msg":"There is no such index"}})");
  try {
    index_.Find("/v/a");
    ADD_FAILURE();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), 1403);
    EXPECT_EQ(error.reason(), "Request failed, msg=There is no such index");
  }
  EXPECT_EQ(engine_->Asked().size(), 1U);
}

TEST_F(ElasticIndexTest, QuestionsShareAConnectionUntilTheEngineIsStartedAnew) {
  for (int i = 0; i < 5; ++i) {
    engine_->Answer(kNone);
    index_.Find("/v/a");
  }
  EXPECT_EQ(engine_->ConnectionCount(), 1U);
  engine_.reset();
  engine_ = std::make_unique<ScriptedEngine>(EngineSocketPath());
  engine_->Answer(kNone);
  EXPECT_FALSE(index_.Find("/v/a"));
  EXPECT_EQ(engine_->Asked().size(), 1U);
}

TEST_F(ElasticIndexTest, ABusyEngineIsAskedUntilTheWorkerStops) {
  for (int i = 0; i < 100; ++i) engine_->Answer(kBusy);
  std::thread stopper([this] {
    EXPECT_TRUE(test::WaitUntil([this] { return !engine_->Asked().empty(); }));
    gate_.Stop();
  });
  EXPECT_THROW(index_.Delete("/v/a"), Interrupted);
  stopper.join();
}

TEST_F(ElasticIndexTest, CarriesNothingWhileItIsHeldUp) {
  std::atomic<int> asked{0};
  const test::ServerThread reader(ExtractorSocketPath(),
                                  [&](const std::string&, const daemon::Peer&) {
                                    // What comes behind this answer is left.
                                    if (++asked == 1) gate_.SetPaused(true);
                                    return R"({"data":[{"TARNMDPath":"/v/a"}]})";
                                  });
  engine_->Answer(R"({"success":true,"data":[{"success":true}]})");
  // A thread keeps its connections.
  std::thread([&] {
    EXPECT_THAT(index_.UpsertMany({{"/v/a"}, {"/v/b"}, {"/v/c"}}), ElementsAre(true, false, false));
    EXPECT_EQ(asked, 1);
    gate_.SetPaused(false);
    gate_.Stop();
    EXPECT_THAT(index_.UpsertMany({{"/v/a"}}), ElementsAre(false));
    EXPECT_EQ(asked, 1);
  }).join();
}

TEST_F(ElasticIndexTest, CannotReadWithoutTheReader) {
  EXPECT_FALSE(index_.CanRead());
  const test::ServerThread reader(ExtractorSocketPath(),
                                  [](const std::string&, const daemon::Peer&) { return "{}"; });
  EXPECT_TRUE(index_.CanRead());
}

}  // namespace
}  // namespace quarry::fileindexd
