#include "daemons/tarncontentextractd/worker_protocol.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <utility>

#include "daemons/tarncontentextractd/utf8.h"

namespace quarry::extract {
namespace {

constexpr std::string_view kFieldPrefix = "TARNMD";
constexpr std::size_t kMaxNameBytes = 64;

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

bool ReceiveAll(int channel, char* buffer, std::size_t size, UniqueFd* file) {
  while (size > 0) {
    Attachment attachment;
    iovec part{buffer, size};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = attachment.bytes;
    message.msg_controllen = sizeof(attachment.bytes);
    const ssize_t count = recvmsg(channel, &message, MSG_CMSG_CLOEXEC);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return false;
    TakeAttached(&message, file);
    buffer += count;
    size -= static_cast<std::size_t>(count);
  }
  return true;
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
  for (const Field& field : fields) {
    PutText(bytes, field.name);
    PutValue(bytes, field.value);
  }
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

bool SendRequest(int channel, const std::string& extension, int file) {
  const std::string text = MakeMessage(std::string_view(extension).substr(0, kMaxExtensionBytes));
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
  // So few bytes fit the socket's buffer whole: a worker that waits has emptied it.
  return count == static_cast<ssize_t>(text.size());
}

bool ReceiveRequest(int channel, std::string* extension, UniqueFd* file) {
  file->Reset();
  std::uint32_t size = 0;
  if (!ReceiveAll(channel, reinterpret_cast<char*>(&size), sizeof(size), file)) return false;
  if (size > kMaxExtensionBytes) return false;
  extension->resize(size);
  return ReceiveAll(channel, extension->data(), size, file) && file->valid();
}

bool SendAnswer(int channel, std::string_view text) {
  const std::string message = MakeMessage(text);
  std::string_view rest = message;
  while (!rest.empty()) {
    // Plain write(): the sandbox allows nothing more.
    const ssize_t count = write(channel, rest.data(), rest.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return false;
    rest.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

}  // namespace quarry::extract
