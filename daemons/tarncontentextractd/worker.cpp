#include "daemons/tarncontentextractd/worker.h"

#include <malloc.h>
#include <sys/time.h>
#include <unistd.h>

#include <chrono>
#include <exception>
#include <new>
#include <string>

#include "daemons/tarncontentextractd/charset.h"
#include "daemons/tarncontentextractd/markup.h"
#include "daemons/tarncontentextractd/sandbox.h"
#include "daemons/tarncontentextractd/worker_protocol.h"

namespace quarry::extract {
namespace {

// Longer than the daemon waits, so that it is the daemon that notices.
constexpr int kLastResortSeconds = 60;

void SetTimer(int seconds) {
  itimerval timer{};
  timer.it_value.tv_sec = seconds;
  setitimer(ITIMER_REAL, &timer, nullptr);
}

// What one file's text took serves the next one's. Given back in between, it would be asked for and
// cleared page by page for each file. The sandbox bounds the whole.
void KeepSomeHeap() {
#ifdef __GLIBC__
  mallopt(M_MMAP_THRESHOLD, 4 << 20);
  mallopt(M_TRIM_THRESHOLD, 4 << 20);
#endif
}

// Libraries fetch data at first use; what they open must be open before the sandbox closes.
void LoadData() {
  PrepareXmlLibrary();
  for (const char* charset : {"UTF-8", "windows-1252", "Shift_JIS"}) ConvertToUtf8("x", charset);
}

// A worker whose parsers cannot work at all must not get as far as the first file, which would be
// taken for the cause.
void TryParsers(const Registry& registry) {
  for (const char* extension : {"html", "xml", "md", "txt"}) {
    Source source = Source::OfBytes(
        "<p>gr\xFC\xDF"
        "e</p>\n",
        extension);
    ParseFile(registry, source);
  }
}

// Answers that the daemon need not be woken for yet, since there is more to do. It must not wait
// long for any: a file that may take its time is begun with nothing held back, and no file is begun
// with the answer of one that has taken its time.
class HeldAnswers {
 public:
  explicit HeldAnswers(int channel) : channel_(channel) {}

  void Add(const std::string& message) { held_ += message; }

  // Sends what must not wait until the next file is done. Returns false when the daemon is gone.
  bool BeginFile(Source& next) {
    const Clock::time_point now = Clock::now();
    const bool may_wait =
        held_.size() < kMostHeld && next.Expected() <= kQuickFile && now - since_ < kLongestHeld;
    if (may_wait && !held_.empty()) return true;
    since_ = now;
    return Send();
  }

  // Returns false when the daemon is gone.
  bool Send() {
    const bool sent = SendMessage(channel_, held_);
    held_.clear();
    return sent;
  }

 private:
  using Clock = std::chrono::steady_clock;
  static constexpr std::size_t kMostHeld = std::size_t{64} << 10;
  static constexpr std::size_t kQuickFile = std::size_t{64} << 10;
  static constexpr std::chrono::milliseconds kLongestHeld{20};

  int channel_;
  std::string held_;
  Clock::time_point since_;  // the first of the files was begun
};

}  // namespace

std::vector<Field> ParseFile(const Registry& registry, Source& source) {
  Extraction extraction;
  try {
    const Extractor* extractor = registry.Find(source);
    if (extractor != nullptr) extractor->Extract(source, extraction);
  } catch (const std::bad_alloc&) {
    _exit(kExitOutOfMemory);
  } catch (const std::exception&) {
    // What was found before is good.
    return extraction.Take();
  }
  return extraction.Take();
}

bool Announce(int channel, const std::string& problem) {
  return SendMessage(channel, MakeMessage(problem.empty() ? kReady : problem)) && problem.empty();
}

void ServeFiles(const Registry& registry, int channel, int seconds) {
  HeldAnswers answers(channel);
  Request request;
  while (true) {
    Received received = ReceiveRequest(channel, false, &request);
    if (received == Received::kNothing) {
      SetTimer(0);
      if (!answers.Send()) return;
      received = ReceiveRequest(channel, true, &request);
    }
    if (received != Received::kRequest) return;
    SetTimer(seconds);
    Source source(request.file.get(), request.extension);
    if (!answers.BeginFile(source)) return;
    answers.Add(MakeAnswer(request.number, ParseFile(registry, source)));
  }
}

int RunWorker(const Registry& registry, int channel) {
  closefrom(channel + 1);
  KeepSomeHeap();
  LoadData();
  std::string problem = CloseSandbox(channel);
  if (problem.empty()) problem = FindGap();
  if (problem.empty()) TryParsers(registry);
  if (!Announce(channel, problem)) return kExitNotClosed;
  ServeFiles(registry, channel, kLastResortSeconds);
  return kExitOk;
}

}  // namespace quarry::extract
