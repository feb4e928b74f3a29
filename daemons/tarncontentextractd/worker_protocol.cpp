#include "daemons/tarncontentextractd/worker_protocol.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <utility>

#include "daemons/tarncontentextractd/utf8.h"

namespace quarry::extract {
namespace {

constexpr std::string_view kFieldPrefix = "TARNMD";
constexpr std::size_t kMaxNameBytes = 64;
constexpr std::size_t kNumberBytes = sizeof(std::uint32_t);
constexpr std::size_t kMaxRequestBytes = kNumberBytes + kMaxExtensionBytes;

template <typename T>
void PutRaw(std::string& out, T value) {
  out.append(reinterpret_cast<const char*>(&value), sizeof(value));
}

template <typename T>
bool TakeRaw(std::string_view* in, T* value) {
  if (in->size() < sizeof(T)) return false;
  std::memcpy(value, in->data(), sizeof(T));
  in->remove_prefix(sizeof(T));
  return true;
}

void PutText(std::string& out, std::string_view text) {
  PutRaw(out, static_cast<std::uint32_t>(text.size()));
  out.append(text);
}

bool TakeText(std::string_view* in, std::size_t limit, std::string* text) {
  std::uint32_t size = 0;
  if (!TakeRaw(in, &size) || size > limit || size > in->size()) return false;
  text->assign(in->substr(0, size));
  in->remove_prefix(size);
  return true;
}

bool IsFieldName(const std::string& name) {
  return name.compare(0, kFieldPrefix.size(), kFieldPrefix) == 0 &&
         std::all_of(name.begin(), name.end(),
                     [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); });
}

bool IsText(std::string_view text) {
  return text.find('\0') == std::string_view::npos && IsUtf8(text);
}

void PutValue(std::string& out, const FieldValue& value) {
  out.push_back(static_cast<char>(value.index()));
  if (const auto* text = std::get_if<std::string>(&value)) PutText(out, *text);
  if (const auto* whole = std::get_if<std::int64_t>(&value)) PutRaw(out, *whole);
  if (const auto* real = std::get_if<double>(&value)) PutRaw(out, *real);
}

void PutFields(std::string& out, const std::vector<Field>& fields) {
  std::size_t room = out.size();
  for (const Field& field : fields) {
    const auto* text = std::get_if<std::string>(&field.value);
    room += field.name.size() + (text == nullptr ? 0 : text->size()) + 16;
  }
  out.reserve(room);
  for (const Field& field : fields) {
    PutText(out, field.name);
    PutValue(out, field.value);
  }
}

template <typename T>
bool TakeNumber(std::string_view* in, FieldValue* value) {
  T number{};
  if (!TakeRaw(in, &number)) return false;
  *value = number;
  // Not every pattern of bits is a number that can be written down again.
  return number - number == T{};
}

bool TakeValue(std::string_view* in, FieldValue* value) {
  char index = 0;
  if (!TakeRaw(in, &index)) return false;
  if (index == 1) return TakeNumber<std::int64_t>(in, value);
  if (index == 2) return TakeNumber<double>(in, value);
  std::string text;
  if (index != 0 || !TakeText(in, kMaxTextBytes, &text) || !IsText(text)) return false;
  *value = std::move(text);
  return true;
}

bool TakeField(std::string_view* in, Field* field) {
  return TakeText(in, kMaxNameBytes, &field->name) && IsFieldName(field->name) &&
         TakeValue(in, &field->value);
}

// One descriptor beside the data of a message.
struct Attachment {
  alignas(cmsghdr) char bytes[CMSG_SPACE(sizeof(int))] = {};
};

void Attach(msghdr* message, Attachment* attachment, int file) {
  message->msg_control = attachment->bytes;
  message->msg_controllen = sizeof(attachment->bytes);
  cmsghdr* header = CMSG_FIRSTHDR(message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof(int));
  std::memcpy(CMSG_DATA(header), &file, sizeof(file));
}

// Takes a descriptor out of a received message, if there is one.
void TakeAttached(msghdr* message, UniqueFd* file) {
  const cmsghdr* header = CMSG_FIRSTHDR(message);
  if (header == nullptr || header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) {
    return;
  }
  int fd = -1;
  std::memcpy(&fd, CMSG_DATA(header), sizeof(fd));
  file->Reset(fd);
}

// What has come, at least one byte; 0 when nothing more comes, -1 when nothing has yet. (Together
// with a descriptor never more than the message that brought it.)
ssize_t ReceiveSome(int channel, bool wait, char* buffer, std::size_t size, UniqueFd* file) {
  Attachment attachment;
  iovec part{buffer, size};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = attachment.bytes;
  message.msg_controllen = sizeof(attachment.bytes);
  ssize_t count = 0;
  do {
    count = recvmsg(channel, &message, MSG_CMSG_CLOEXEC | (wait ? 0 : MSG_DONTWAIT));
  } while (count < 0 && errno == EINTR);
  if (count < 0) return errno == EAGAIN && !wait ? -1 : 0;
  TakeAttached(&message, file);
  return count;
}

}  // namespace

std::string MakeMessage(std::string_view text) {
  std::string message;
  message.reserve(text.size() + sizeof(std::uint32_t));
  PutText(message, text);
  return message;
}

std::string EncodeFields(const std::vector<Field>& fields) {
  std::string bytes;
  PutFields(bytes, fields);
  return bytes;
}

bool DecodeFields(std::string_view bytes, std::vector<Field>* out) {
  out->clear();
  while (!bytes.empty()) {
    Field field;
    if (out->size() > kMaxFields || !TakeField(&bytes, &field)) {
      out->clear();
      return false;
    }
    out->push_back(std::move(field));
  }
  return true;
}

std::string MakeAnswer(std::uint32_t number, const std::vector<Field>& fields) {
  std::string message(sizeof(std::uint32_t), '\0');
  PutRaw(message, number);
  PutFields(message, fields);
  const auto size = static_cast<std::uint32_t>(message.size() - sizeof(std::uint32_t));
  std::memcpy(message.data(), &size, sizeof(size));
  return message;
}

bool ReadAnswer(std::string_view bytes, std::uint32_t number, std::vector<Field>* out) {
  out->clear();
  std::uint32_t given = 0;
  return TakeRaw(&bytes, &given) && given == number && DecodeFields(bytes, out);
}

bool SendRequest(int channel, std::uint32_t number, const std::string& extension, int file) {
  std::string request;
  PutRaw(request, number);
  request.append(extension, 0, kMaxExtensionBytes);
  const std::string text = MakeMessage(request);
  iovec part{const_cast<char*>(text.data()), text.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  Attachment attachment;
  Attach(&message, &attachment, file);
  ssize_t count = 0;
  do {
    count = sendmsg(channel, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
  } while (count < 0 && errno == EINTR);
  // So few bytes are taken whole or not at all.
  return count == static_cast<ssize_t>(text.size());
}

Received ReceiveRequest(int channel, bool wait, Request* request) {
  request->file.Reset();
  std::array<char, sizeof(std::uint32_t) + kMaxRequestBytes> buffer;
  std::size_t got = 0;
  std::uint32_t size = 0;
  do {
    const ssize_t count = ReceiveSome(channel, wait || got > 0, buffer.data() + got,
                                      buffer.size() - got, &request->file);
    if (count < 0) return Received::kNothing;
    if (count == 0) return Received::kEnd;
    got += static_cast<std::size_t>(count);
    if (got < sizeof(size)) continue;
    std::memcpy(&size, buffer.data(), sizeof(size));
    if (size < kNumberBytes || size > kMaxRequestBytes) return Received::kEnd;
  } while (got < sizeof(size) + size);
  std::string_view text(buffer.data() + sizeof(size), got - sizeof(size));
  if (text.size() > size || !request->file.valid()) return Received::kEnd;
  TakeRaw(&text, &request->number);
  request->extension.assign(text);
  return Received::kRequest;
}

bool SendMessage(int channel, std::string_view message) {
  while (!message.empty()) {
    // Plain write(): the sandbox allows nothing more.
    const ssize_t count = write(channel, message.data(), message.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return false;
    message.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

}  // namespace quarry::extract
