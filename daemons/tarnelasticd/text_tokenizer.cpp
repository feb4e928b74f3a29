#include "daemons/tarnelasticd/text_tokenizer.h"

#include <algorithm>
#include <array>
#include <climits>
#include <exception>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

constexpr unsigned char kSeparator = 0;
constexpr unsigned char kNotAscii = 0xff;

// What each byte becomes in a word, or kSeparator, or kNotAscii.
constexpr std::array<unsigned char, 256> MakeFolding() {
  std::array<unsigned char, 256> folding{};
  for (std::size_t c = '0'; c <= '9'; ++c) folding[c] = static_cast<unsigned char>(c);
  for (std::size_t c = 'a'; c <= 'z'; ++c) {
    folding[c] = static_cast<unsigned char>(c);
    folding[c - 'a' + 'A'] = static_cast<unsigned char>(c);
  }
  for (std::size_t c = 0x80; c <= 0xff; ++c) folding[c] = kNotAscii;
  return folding;
}

constexpr std::array<unsigned char, 256> kFolding = MakeFolding();

unsigned char FoldingOf(char c) {
  return kFolding[static_cast<unsigned char>(c)];
}

constexpr const char* kReplacement = "\xEF\xBF\xBD";

struct Visit {
  const TextTokenizer::Visitor* visitor;
  std::exception_ptr failure;  // exceptions must not cross SQLite's frames
};

int OnToken(void* context, int /*flags*/, const char* token, int size, int begin, int end) {
  auto* visit = static_cast<Visit*>(context);
  try {
    const bool go_on =
        (*visit->visitor)({token, static_cast<std::size_t>(size)}, static_cast<std::size_t>(begin),
                          static_cast<std::size_t>(end));
    return go_on ? SQLITE_OK : SQLITE_DONE;
  } catch (...) {
    visit->failure = std::current_exception();
    return SQLITE_ERROR;
  }
}

void AppendSeparators(std::string* out, std::string_view text) {
  while (!text.empty()) {
    const std::size_t length = Utf8Length(text);
    if (length == 0) {
      out->append(kReplacement);
    } else if (static_cast<unsigned char>(text.front()) < 0x20 || text.front() == 0x7f) {
      out->push_back(' ');
    } else {
      out->append(text.substr(0, length));
    }
    text.remove_prefix(std::max<std::size_t>(length, 1));
  }
}

}  // namespace

fts5_api* Fts5Api(sqlite3* db) {
  fts5_api* api = nullptr;
  sqlite3_stmt* stmt = nullptr;
  if (sqlite3_prepare_v2(db, "SELECT fts5(?1)", -1, &stmt, nullptr) == SQLITE_OK) {
    sqlite3_bind_pointer(stmt, 1, static_cast<void*>(&api), "fts5_api_ptr", nullptr);
    sqlite3_step(stmt);
  }
  sqlite3_finalize(stmt);
  if (api == nullptr) throw Error(kStorageFailed, "The database library has no full text search");
  return api;
}

std::size_t Utf8Length(std::string_view text) {
  const auto first = static_cast<unsigned char>(text.front());
  const std::size_t length = first < 0x80                     ? 1
                             : first >= 0xc2 && first <= 0xdf ? 2
                             : first >= 0xe0 && first <= 0xef ? 3
                             : first >= 0xf0 && first <= 0xf4 ? 4
                                                              : 0;
  if (length > text.size()) return 0;
  for (std::size_t i = 1; i < length; ++i) {
    if ((static_cast<unsigned char>(text[i]) & 0xc0) != 0x80) return 0;
  }
  return length;
}

std::size_t CountCharacters(std::string_view text) {
  std::size_t count = 0;
  for (; !text.empty(); ++count) text.remove_prefix(std::max<std::size_t>(Utf8Length(text), 1));
  return count;
}

TextTokenizer::TextTokenizer(sqlite3* db) {
  fts5_api* api = Fts5Api(db);
  void* user_data = nullptr;
  const char* arguments[] = {"remove_diacritics", "2"};
  if (api->xFindTokenizer(api, "unicode61", &user_data, &functions_) != SQLITE_OK ||
      functions_.xCreate(user_data, arguments, 2, &tokenizer_) != SQLITE_OK) {
    throw Error(kStorageFailed, "The database library cannot make a tokenizer");
  }
}

TextTokenizer::~TextTokenizer() {
  functions_.xDelete(tokenizer_);
}

void TextTokenizer::ForEach(std::string_view text, const Visitor& visit) const {
  Visit context{&visit, nullptr};
  const auto size = static_cast<int>(std::min<std::size_t>(text.size(), INT_MAX));
  const int result =
      functions_.xTokenize(tokenizer_, &context, FTS5_TOKENIZE_AUX, text.data(), size, &OnToken);
  if (context.failure) std::rethrow_exception(context.failure);
  if (result != SQLITE_OK && result != SQLITE_DONE) {
    ThrowSqlite(nullptr, result, "Cannot cut a text into words");
  }
}

std::size_t TextTokenizer::SkipSeparators(std::string_view text) {
  std::size_t at = 0;
  while (at < text.size() && FoldingOf(text[at]) == kSeparator) ++at;
  return at;
}

std::size_t TextTokenizer::FindAsciiSeparator(std::string_view text) {
  std::size_t at = 0;
  while (at < text.size() && FoldingOf(text[at]) != kSeparator) ++at;
  return at;
}

// The size of the word at the beginning of `text`, or 0 when it may have more than ASCII.
std::size_t TextTokenizer::FoldAsciiWord(std::string_view text, std::string* folded) {
  std::size_t end = std::min(folded->size(), text.size());
  char* out = folded->data();
  for (std::size_t size = 0;; ++size) {
    if (size == end) {
      if (size == text.size()) return size;
      folded->resize(std::max<std::size_t>(64, 2 * size));
      end = std::min(folded->size(), text.size());
      out = folded->data();
    }
    const unsigned char c = FoldingOf(text[size]);
    if (c == kSeparator) return size;
    if (c == kNotAscii) return 0;
    out[size] = static_cast<char>(c);
  }
}

std::vector<std::string> TextTokenizer::Words(std::string_view text) const {
  std::vector<std::string> words;
  ForEach(text, [&words](std::string_view word, std::size_t, std::size_t) {
    words.emplace_back(word);
    return true;
  });
  return words;
}

std::string TextTokenizer::Fold(std::string_view text) const {
  std::string folded;
  std::size_t done = 0;
  ForEach(text, [&](std::string_view word, std::size_t begin, std::size_t end) {
    AppendSeparators(&folded, text.substr(done, begin - done));
    folded.append(word);
    done = end;
    return true;
  });
  AppendSeparators(&folded, text.substr(done));
  return folded;
}

}  // namespace quarry::engine
