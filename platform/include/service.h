// Services of the machine, the file-sharing service's search support, and running programs.
//
// Functions that return int return a negative number on failure, with the platform's last error
// set, else 0 unless said otherwise. They block until the service manager has answered or the
// program has ended, and may be called from any thread.

#ifndef QUARRY_PLATFORM_INCLUDE_SERVICE_H_
#define QUARRY_PLATFORM_INCLUDE_SERVICE_H_

#include "common/export.h"

constexpr int HLIB_SERVICECTL_UPSTART = 1;

extern "C" {

// Starts a service that is registered with the platform, and makes sure it stays started; `wait`
// nonzero waits until it runs. Success when it runs already.
QUARRY_EXPORT int HLIBServiceStart(const char* name, int wait);

// Stops a service; it is not started again by itself. Success when it does not run. `force` nonzero
// does not let it finish its work.
QUARRY_EXPORT int HLIBServiceStop(const char* name, int force);

// Stops a service, where it runs, and starts it.
QUARRY_EXPORT int HLIBServiceRestart(const char* name);

// The same for a job; `kind` is HLIB_SERVICECTL_UPSTART.
QUARRY_EXPORT int HLIBServicectlStart(const char* job, int kind);
QUARRY_EXPORT int HLIBServicectlStop(const char* job, int kind);

// Whether the file-sharing service offers search: 1, 0, or negative when it cannot be told.
QUARRY_EXPORT int TARNSMBIsEnableSpotlight();
// Switches it on (1) or off (0); takes effect when the service restarts.
QUARRY_EXPORT int TARNSMBSetSpotlight(int enable);

// Runs a program and waits for it. `flags` is a bit set of the platform's; the arguments follow,
// the program's own name among them, ended by a null pointer. Returns the exit status, or a
// negative number when the program could not be run.
QUARRY_EXPORT int HLIBCExecl(const char* program, unsigned int flags, ...);

// The same without flags: the arguments behind the program's own name, ended by a null pointer.
QUARRY_EXPORT int HLIBCExec(const char* program, ...);

}  // extern "C"

#endif  // QUARRY_PLATFORM_INCLUDE_SERVICE_H_
