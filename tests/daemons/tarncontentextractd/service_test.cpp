#include "daemons/tarncontentextractd/service.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <random>
#include <thread>

#include "common/error.h"
#include "common/json.h"
#include "daemons/tarncontentextractd/stamp.h"
#include "tests/daemons/tarncontentextractd/support/extract_support.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::extract {
namespace {

using std::chrono::seconds;

WorkerPoolOptions Options(const std::vector<std::string>& command) {
  WorkerPoolOptions options;
  options.command = command;
  options.workers = 2;
  options.start_timeout = seconds(60);
  options.file_timeout = seconds(60);
  options.pause = std::chrono::hours(1);
  return options;
}

class ServiceTest : public ::testing::Test {
 protected:
  explicit ServiceTest(const std::vector<std::string>& command = RealWorker())
      : pool_(Options(command)), service_(pool_) {
    test::WriteFile(dir_ / "page.html", "<!doctype html><title>A title</title><p>Some words");
  }

  Json::Value Ask(const std::string& request) {
    Json::Value answer;
    EXPECT_TRUE(fromString(answer, service_.Handle(request))) << request;
    return answer;
  }
  // The code and the text of the error that the request is answered with.
  std::string ErrorOf(const std::string& request) {
    const Json::Value answer = Ask(request);
    EXPECT_EQ(answer.getMemberNames(), (Json::Value::Members{"error", "success"})) << request;
    EXPECT_FALSE(answer["success"].asBool());
    return answer["error"]["code"].asString() + " " + answer["error"]["msg"].asString();
  }
  Json::Value Document(const std::string& path) { return service_.ParseFile(path, true); }
  static bool HasContent(const Json::Value& document) {
    return document.isMember("TARNMDTextContent");
  }
  static std::string StampOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(lstat(path.c_str(), &status), 0);
    return ContentStamp(status);
  }

  test::TempDir dir_;
  WorkerPool pool_;
  ExtractService service_;
};

// A request for the documents of these paths, which need no escaping.
std::string ManyRequest(const std::vector<std::string>& paths, bool need_meta) {
  std::string request = "{\"command\":\"parse_many\",\"data\":{\"files\":[";
  for (const std::string& path : paths) {
    if (request.back() != '[') request += ',';
    request += R"({"path":")" + path + R"(","options":{"need_meta":)";
    request += need_meta ? "true}}" : "false}}";
  }
  return request + "]}}";
}

TEST_F(ServiceTest, ManyDocumentsAreThoseOfEachPath) {
  test::WriteFile(dir_ / "b.txt", "Other words");
  const std::vector<std::string> paths = {dir_ / "page.html", dir_ / "missing", dir_ / "b.txt",
                                          dir_.path(), "relative"};
  for (const bool need_meta : {true, false}) {
    const Json::Value answer = Ask(ManyRequest(paths, need_meta));
    EXPECT_EQ(answer.getMemberNames(), (Json::Value::Members{"data", "success"}));
    EXPECT_TRUE(answer["success"].asBool());
    const Json::Value& data = answer["data"];
    ASSERT_EQ(data.size(), paths.size());
    for (const Json::ArrayIndex i : {0U, 2U, 3U}) {
      EXPECT_EQ(data[i], service_.ParseFile(paths[i], need_meta)) << paths[i];
    }
    EXPECT_TRUE(data[1].isNull());
    EXPECT_TRUE(data[4].isNull());
  }
  EXPECT_EQ(toString(Ask(ManyRequest({}, true))), R"({"data":[],"success":true})");
}

TEST_F(ServiceTest, ManyDocumentsAreAnsweredUpToABound) {
  std::string words;
  while (words.size() < kManyBytes / 2) words += "some more words ";
  std::vector<std::string> paths;
  for (int i = 0; i < 5; ++i) {
    paths.push_back(dir_ / (std::to_string(i) + ".txt"));
    test::WriteFile(paths.back(), words);
  }
  const Json::Value answer = Ask(ManyRequest(paths, true));
  EXPECT_GE(answer["data"].size(), 1U);
  EXPECT_LE(answer["data"].size(), 3U);
  EXPECT_EQ(answer["data"][0]["TARNMDPath"].asString(), paths[0]);
}

TEST_F(ServiceTest, AWrongRequestForManyIsRefused) {
  EXPECT_EQ(ErrorOf(R"({"command":"parse_many","data":{}})").substr(0, 4), "120 ");
  EXPECT_EQ(ErrorOf(R"({"command":"parse_many","data":{"files":"/a"}})"),
            "120 Not an array: files");
  EXPECT_EQ(ErrorOf(R"({"command":"parse_many"})").substr(0, 4), "120 ");
  EXPECT_EQ(toString(Ask(R"({"command":"parse_many","data":{"files":[7,{},"/"]}})")),
            R"({"data":[null,null,null],"success":true})");
}

TEST_F(ServiceTest, AnExtractorThatStopsSaysSoForMany) {
  pool_.Stop();
  EXPECT_EQ(ErrorOf(ManyRequest({dir_ / "page.html"}, true)), "502 The extractor is stopping");
}

TEST_F(ServiceTest, ADocumentHasAttributesAndContent) {
  const std::string path = dir_ / "page.html";
  const Json::Value answer = Ask("{\"command\":\"parse\",\"data\":{\"path\":\"" + path +
                                 "\",\"options\":{\"need_meta\":true}}}");
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_EQ(answer.getMemberNames(), (Json::Value::Members{"data", "success"}));
  const Json::Value& document = answer["data"];
  EXPECT_EQ(document["TARNMDPath"].asString(), path);
  EXPECT_EQ(document["TARNMDFSName"].asString(), "page.html");
  EXPECT_EQ(document["TARNMDExtension"].asString(), "html");
  EXPECT_EQ(document["TARNMDTitle"].asString(), "A title");
  EXPECT_EQ(document["TARNMDTextContent"].asString(), "Some words");
  EXPECT_EQ(document["QuarryContentStamp"].asString(), StampOf(path));
}

TEST_F(ServiceTest, WithoutNeedOfMetaNoWorkerIsAsked) {
  for (const char* options :
       {"", ",\"options\":{}", ",\"options\":null", ",\"options\":{\"need_meta\":false}"}) {
    const Json::Value answer = Ask("{\"command\":\"parse\",\"data\":{\"path\":\"" +
                                   (dir_ / "page.html") + "\"" + options + "}}");
    EXPECT_EQ(answer["data"]["TARNMDFSName"].asString(), "page.html") << options;
    EXPECT_FALSE(HasContent(answer["data"])) << options;
    EXPECT_FALSE(answer["data"].isMember("QuarryContentStamp")) << options;
  }
  EXPECT_EQ(pool_.WorkerCount(), 0u);
}

TEST_F(ServiceTest, WhatHasNoContentHasAttributesAndAStamp) {
  test::WriteFile(dir_ / "empty.txt", "");
  test::MakeDirs(dir_ / "dir.d");
  ASSERT_EQ(symlink("page.html", (dir_ / "link").c_str()), 0);
  ASSERT_EQ(mkfifo((dir_ / "fifo").c_str(), 0600), 0);
  for (const char* name : {"empty.txt", "dir.d", "link", "fifo"}) {
    const Json::Value document = Document(dir_ / name);
    EXPECT_EQ(document["TARNMDFSName"].asString(), name);
    EXPECT_FALSE(HasContent(document)) << name;
    EXPECT_EQ(document["QuarryContentStamp"].asString(), StampOf(dir_ / name));
  }
  EXPECT_EQ(Document("/dev/zero")["TARNMDFSName"].asString(), "zero");
  EXPECT_TRUE(Document(dir_ / "dir.d")["TARNMDIsDir"].asBool());
  EXPECT_EQ(pool_.WorkerCount(), 0u) << "nothing of it is ever opened";
}

TEST_F(ServiceTest, OtherDataHasAttributesAndAStamp) {
  test::WriteFile(dir_ / "a.bin", std::string("\x7F"
                                              "ELF\0\1\2\3\0\0\0\0",
                                              12));
  const Json::Value document = Document(dir_ / "a.bin");
  EXPECT_FALSE(HasContent(document));
  EXPECT_TRUE(document.isMember("QuarryContentStamp"));
}

TEST_F(ServiceTest, NamesAreOfAnyBytes) {
  const std::string path = dir_ / "\xFF\xC3 \"\\\n\x01.TXT";
  test::WriteFile(path, "words");
  Json::Value request;
  request["command"] = "parse";
  request["data"]["path"] = path;
  request["data"]["options"]["need_meta"] = true;
  const Json::Value document = Ask(toString(request))["data"];
  EXPECT_EQ(document["TARNMDPath"].asString(), path);
  EXPECT_EQ(document["TARNMDTextContent"].asString(), "words");
}

TEST_F(ServiceTest, SlashesAtTheEndAreNotPartOfAName) {
  EXPECT_EQ(Document(dir_.path() + "///")["TARNMDPath"].asString(), dir_.path());
  EXPECT_EQ(Document("//")["TARNMDPath"].asString(), "/");
  EXPECT_EQ(Document("/")["TARNMDParent"].asString(), "/");
}

TEST_F(ServiceTest, WhatIsNotThereIsAnError) {
  const auto error_of = [this](const std::string& path) {
    return ErrorOf("{\"command\":\"parse\",\"data\":{\"path\":\"" + path + "\"}}");
  };
  EXPECT_EQ(error_of(dir_ / "none"),
            "914 Cannot open " + (dir_ / "none") + ": No such file or directory");
  EXPECT_EQ(error_of(dir_ / "page.html/below"),
            "914 Cannot open " + (dir_ / "page.html/below") + ": Not a directory");
  EXPECT_EQ(error_of("relative"), "120 Not an absolute path: relative");
  EXPECT_EQ(error_of(""), "120 Not an absolute path: ");
  EXPECT_EQ(error_of("/v/\\u0000a"), "120 A path cannot hold a NUL byte");
}

struct Refusal {
  const char* request;
  const char* error;
};

TEST_F(ServiceTest, RequestsThatAreNoneAreRefused) {
  const Refusal kCases[] = {
      {"", "120 The request is not JSON"},
      {"nonsense", "120 The request is not JSON"},
      {"{\"command\":\"parse\"} x", "120 The request is not JSON"},
      {"null", "120 Missing property: command, data=null"},
      {"[]", "120 Not an object, data=[]"},
      {"7", "120 Not an object, data=7"},
      {"{}", "120 Missing property: command, data={}"},
      {"{\"command\":[]}", "120 Not a string, data={\"command\":[]}"},
      {"{\"command\":\"\"}", "120 Unknown command: "},
      {"{\"command\":\"search\",\"data\":{}}", "120 Unknown command: search"},
      {"{\"command\":\"parse\"}", "120 Missing property: data, data={\"command\":\"parse\"}"},
      {"{\"command\":\"parse\",\"data\":[]}", "120 Not an object, data=[]"},
      {"{\"command\":\"parse\",\"data\":\"/a\"}", "120 Not an object, data=\"/a\""},
      {"{\"command\":\"parse\",\"data\":{}}", "120 Missing property: path, data={}"},
      {"{\"command\":\"parse\",\"data\":{\"path\":{}}}", "120 Not a string, data={\"path\":{}}"},
      {"{\"command\":\"parse\",\"data\":{\"path\":\"/\",\"options\":[]}}",
       "120 Not an object, data=[]"},
      {"{\"command\":\"parse\",\"data\":{\"path\":\"/\",\"options\":true}}",
       "120 Not an object, data=true"},
      {"{\"command\":\"parse\",\"data\":{\"path\":\"/\",\"options\":{\"need_meta\":\"yes\"}}}",
       "120 Not a string, data={\"need_meta\":\"yes\"}"}};
  for (const Refusal& each : kCases) EXPECT_EQ(ErrorOf(each.request), each.error) << each.request;
  const std::string deep(100000, '[');
  EXPECT_EQ(ErrorOf(deep), "120 The request is not JSON");
}

TEST_F(ServiceTest, RequestsChangedAtRandomAreAnswered) {
  std::mt19937 random(9);
  const std::string request = "{\"command\":\"parse\",\"data\":{\"path\":\"" +
                              (dir_ / "page.html") + "\",\"options\":{\"need_meta\":false}}}";
  for (int round = 0; round < 3000; ++round) {
    std::string changed = request;
    for (auto changes = 1 + random() % 4; changes > 0; --changes) {
      changed[random() % changed.size()] = static_cast<char>(random());
    }
    EXPECT_TRUE(Ask(changed)["success"].isBool());
  }
}

TEST_F(ServiceTest, AFileThatMayNotBeReadHasItsAttributes) {
  ASSERT_EQ(chmod((dir_ / "page.html").c_str(), 0), 0);
  const Json::Value document = Document(dir_ / "page.html");
  EXPECT_EQ(document["TARNMDPrivilege"].asString(), "0000");
  // Root reads it all the same.
  EXPECT_EQ(HasContent(document), geteuid() == 0);
  EXPECT_TRUE(document.isMember("QuarryContentStamp"));
}

// Here because the table of descriptors is full for a moment.
TEST_F(ServiceTest, AFileThatCannotBeReadNowIsToBeTriedAgain) {
  // Everything has been used once, so that nothing but this file needs a descriptor then.
  ASSERT_TRUE(HasContent(Document(dir_ / "page.html")));
  rlimit limit{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
  const int lowest_free = UniqueFd(open("/", O_PATH | O_CLOEXEC)).get();
  // Enough to find the file, too few to read it.
  const rlimit tight{static_cast<rlim_t>(lowest_free) + 1, limit.rlim_max};
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &tight), 0);
  const Json::Value document = Document(dir_ / "page.html");
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
  EXPECT_EQ(document["TARNMDFSName"].asString(), "page.html");
  EXPECT_FALSE(HasContent(document));
  EXPECT_FALSE(document.isMember("QuarryContentStamp"));
  EXPECT_TRUE(HasContent(Document(dir_ / "page.html")));
}

TEST_F(ServiceTest, OfManyFilesThoseThatCannotBeReadNowAreToBeTriedAgain) {
  const std::vector<std::string> paths(20, dir_ / "page.html");
  ASSERT_EQ(Ask(ManyRequest(paths, true))["data"].size(), paths.size());
  rlimit limit{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
  const int lowest_free = UniqueFd(open("/", O_PATH | O_CLOEXEC)).get();
  const rlimit tight{static_cast<rlim_t>(lowest_free) + 3, limit.rlim_max};
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &tight), 0);
  const Json::Value data = Ask(ManyRequest(paths, true))["data"];
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
  ASSERT_EQ(data.size(), paths.size());
  int read = 0;
  for (const Json::Value& document : data) {
    // What could not be opened at all is null, and is asked for again as well.
    EXPECT_EQ(document.isMember("QuarryContentStamp"), HasContent(document));
    if (HasContent(document)) ++read;
  }
  EXPECT_GE(read, 2);
}

TEST_F(ServiceTest, ManyAskAtOnce) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 6; ++t) {
    threads.emplace_back([this, t] {
      const std::string path = dir_ / (std::to_string(t) + ".txt");
      test::WriteFile(path, "words of " + std::to_string(t));
      for (int i = 0; i < 20; ++i) {
        EXPECT_EQ(Document(path)["TARNMDTextContent"].asString(), "words of " + std::to_string(t));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

class HostileServiceTest : public ServiceTest {
 protected:
  HostileServiceTest() : ServiceTest(HostileWorker()) {}

  std::string Hostile(const std::string& what) {
    test::WriteFile(dir_ / ("file." + what), "some words");
    return dir_ / ("file." + what);
  }
};

TEST_F(HostileServiceTest, AFileThatKillsItsWorkerIsRememberedAndHasItsAttributes) {
  const std::string bad = Hostile("crash");
  const Json::Value document = Document(bad);
  EXPECT_EQ(document["TARNMDFSSize"].asInt(), 10);
  EXPECT_FALSE(HasContent(document));
  EXPECT_EQ(document["QuarryContentStamp"].asString(), StampOf(bad));
  EXPECT_TRUE(HasContent(Document(Hostile("good"))));
  ASSERT_EQ(pool_.WorkerCount(), 1u);
  EXPECT_EQ(toString(Document(bad)), toString(document));
  EXPECT_EQ(pool_.WorkerCount(), 1u) << "no worker has seen it again";
}

TEST_F(HostileServiceTest, ABadFileThatChangesIsTriedAgain) {
  const std::string bad = Hostile("crash");
  EXPECT_FALSE(HasContent(Document(bad)));
  ASSERT_TRUE(HasContent(Document(Hostile("good"))));
  ASSERT_EQ(pool_.WorkerCount(), 1u);
  test::WriteFile(bad, "other words");
  EXPECT_FALSE(HasContent(Document(bad)));
  EXPECT_EQ(pool_.WorkerCount(), 0u) << "it has killed once more";
}

TEST_F(HostileServiceTest, WhatAParserSaysOverrulesNoAttribute) {
  const Json::Value document = Document(Hostile("overrule"));
  EXPECT_EQ(document["TARNMDPath"].asString(), dir_ / "file.overrule");
  EXPECT_EQ(document["TARNMDFSSize"].asInt(), 10);
  EXPECT_TRUE(document["TARNMDFSSize"].isIntegral());
}

TEST_F(HostileServiceTest, BadFilesAmongManyCostOnlyThemselves) {
  std::vector<std::string> paths;
  for (const char* what : {"good", "crash", "overrule", "garbage", "usedcrash", "ahead"}) {
    paths.push_back(Hostile(what));
  }
  paths.push_back(dir_ / "missing");
  for (int i = 0; i < 20; ++i) {
    paths.push_back(dir_ / (std::to_string(i) + ".good"));
    test::WriteFile(paths.back(), "words of " + std::to_string(i));
  }
  std::vector<Json::Value> documents;
  // An answer may end before all are done.
  for (std::size_t at = 0; at < paths.size(); at = documents.size()) {
    const Json::Value answer =
        Ask(ManyRequest({paths.begin() + static_cast<std::ptrdiff_t>(at), paths.end()}, true));
    ASSERT_GE(answer["data"].size(), 1u);
    for (const Json::Value& each : answer["data"]) documents.push_back(each);
  }
  ASSERT_EQ(documents.size(), paths.size());
  for (std::size_t i = 0; i < paths.size(); ++i) {
    if (i == 6) {
      EXPECT_TRUE(documents[i].isNull());
      continue;
    }
    EXPECT_EQ(documents[i]["TARNMDPath"].asString(), paths[i]);
    EXPECT_EQ(documents[i]["QuarryContentStamp"].asString(), StampOf(paths[i]));
    EXPECT_EQ(HasContent(documents[i]), i == 0 || i == 4 || i > 6) << paths[i];
    if (i > 6) {
      EXPECT_EQ(documents[i]["TARNMDTextContent"].asString(), "words of " + std::to_string(i - 7));
    }
  }
  EXPECT_EQ(documents[2]["TARNMDFSSize"].asInt(), 10);
}

TEST_F(HostileServiceTest, AnAnswerEndsBehindAFileThatStalls) {
  WorkerPoolOptions options = Options(HostileWorker());
  options.file_timeout = seconds(5);
  WorkerPool pool(options);
  ExtractService service(pool);
  const std::vector<std::string> paths = {Hostile("good"), Hostile("stall"), Hostile("pid")};
  Json::Value answer;
  ASSERT_TRUE(fromString(answer, service.Handle(ManyRequest(paths, true))));
  ASSERT_EQ(answer["data"].size(), 2u);
  EXPECT_TRUE(HasContent(answer["data"][0]));
  EXPECT_FALSE(HasContent(answer["data"][1]));
  EXPECT_EQ(answer["data"][1]["QuarryContentStamp"].asString(), StampOf(paths[1]));
  // It is remembered, and the one behind it is no worse for it.
  const std::vector<std::string> rest = {paths[1], paths[2]};
  ASSERT_TRUE(fromString(answer, service.Handle(ManyRequest(rest, true))));
  ASSERT_EQ(answer["data"].size(), 2u);
  EXPECT_TRUE(answer["data"][1].isMember("TARNMDTitle"));
}

class BrokenServiceTest : public ServiceTest {
 protected:
  BrokenServiceTest() : ServiceTest(HostileWorker("open")) {}
};

TEST_F(BrokenServiceTest, WithoutWorkersThereAreAttributesAndNoStamp) {
  const Json::Value document = Document(dir_ / "page.html");
  EXPECT_EQ(document["TARNMDFSName"].asString(), "page.html");
  EXPECT_FALSE(HasContent(document));
  EXPECT_FALSE(document.isMember("QuarryContentStamp")) << "another time it may succeed";
}

TEST_F(BrokenServiceTest, WithoutWorkersEachOfManyHasItsAttributes) {
  const std::vector<std::string> paths(5, dir_ / "page.html");
  const Json::Value data = Ask(ManyRequest(paths, true))["data"];
  ASSERT_EQ(data.size(), paths.size());
  for (const Json::Value& document : data) {
    EXPECT_EQ(document["TARNMDFSName"].asString(), "page.html");
    EXPECT_FALSE(HasContent(document));
    EXPECT_FALSE(document.isMember("QuarryContentStamp"));
  }
}

TEST_F(ServiceTest, IsAnErrorWhileTheDaemonStops) {
  pool_.Stop();
  EXPECT_EQ(ErrorOf("{\"command\":\"parse\",\"data\":{\"path\":\"" + (dir_ / "page.html") +
                    "\",\"options\":{\"need_meta\":true}}}"),
            "502 The extractor is stopping");
}

}  // namespace
}  // namespace quarry::extract
