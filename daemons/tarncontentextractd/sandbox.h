// Giving up everything that a parser does not need.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SANDBOX_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SANDBOX_H_

#include <cstddef>
#include <string>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define QUARRY_SANITIZED_BUILD 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer) || \
    __has_feature(memory_sanitizer)
#define QUARRY_SANITIZED_BUILD 1
#endif
#endif

namespace quarry::extract {

// Sanitizers reserve terabytes of addresses and make system calls of their own: programs built with
// one parse in workers that are not closed off, and the daemon says so. Such a build is for tests
// alone, and those of the sandbox itself use a worker that is built without a sanitizer.
#ifdef QUARRY_SANITIZED_BUILD
inline constexpr bool kSandboxed = false;
#else
inline constexpr bool kSandboxed = true;
#endif

// How much memory a worker may have, program and libraries included.
inline constexpr std::size_t kWorkerMemoryBytes = std::size_t{512} << 20;
// How much processor time in its whole life. (Each file has a deadline of its own.)
inline constexpr unsigned kWorkerCpuSeconds = 600;

// From here on this process, which has one thread, can read descriptors that it holds or is sent on
// `channel`, answer on `channel`, and compute; for good. It has no account's rights, opens nothing,
// starts nothing, and what it tries beyond that fails with EPERM. Returns the empty string, or what
// could not be closed.
std::string CloseSandbox(int channel);

// Tries what must be impossible by now. Returns the empty string, or what was possible after all.
std::string FindGap();

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_SANDBOX_H_
