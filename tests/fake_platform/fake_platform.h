// A stand-in for the platform: every function of platform/include answered from a small world that
// a test describes, recorded, and failing at will.
//
// All functions here may be called from any thread. Names of functions are those of the platform's
// headers ("TARNShareGet"); members are written with their class ("MonitorQueue::Upsert",
// "DomainSockConnection::Connect", "SockConnection::Send", "SockConnection::Recv",
// "SockConnection::Disconnect").

#ifndef QUARRY_TESTS_FAKE_PLATFORM_FAKE_PLATFORM_H_
#define QUARRY_TESTS_FAKE_PLATFORM_FAKE_PLATFORM_H_

#include <json/json.h>

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace quarry::fake {

// Forgets everything: calls, failures, hooks, engine script and world. The world then holds no
// share, the accounts "root" (0, 0), "tester" (the caller, unless it is root) and "Quarry" (with
// the caller's ids), every path is on a file system of type 1, quota is enough, permissions are 7,
// search support of the file-sharing service is off. Calls system_calls' Reset too.
void Reset();

// ---- What was called

// The calls in order, as "TARNShareGet(photo)": arguments separated by ", ", output arguments left
// out, JSON as compact text, bools as true and false. Not recorded: HLIBCSzListPush, -Count, -Get
// and HLIBCUnicodeUTF8StrCaseCmp.
std::vector<std::string> Calls();
// Those of one function.
std::vector<std::string> CallsOf(const std::string& function);
// Keeps the world and the failures that are still to come.
void ClearCalls();
// Runs at the beginning of each recorded call, with the function's name and no lock held.
void OnCall(std::function<void(const std::string& function)> hook);

// Platform records, lists and connections that were handed out and not given back yet.
int Outstanding();

// ---- Failures

struct Failure {
  int result = -1;       // returned by functions of type int; others return null or false, or throw
  int error_number = 0;  // errno, left alone when 0
  int platform_error = 0;  // HLIBCErrGet(), left alone when 0
};
// Makes the nth call of `function` from now on fail, counted from 1.
void FailCall(const std::string& function, int nth = 1, const Failure& failure = {});
// Makes every call from now on fail, until StopFailing.
void FailEveryCall(const std::string& function, const Failure& failure = {});
void StopFailing(const std::string& function);
// What HLIBCErrGet, HLIBCErrorGetFile and HLIBCErrorGetLine answer.
void SetPlatformError(int code, const std::string& file = "", int line = 0);

// ---- The world

struct Share {
  std::string name;
  std::string path;
  bool hide_unreadable = false;
  bool encrypted = false;
  bool read_only = false;
  bool encryption = false;
  bool recycle_bin = false;
  int ftp_privilege = 0;
  std::map<std::string, int> privileges = {};  // by account; others have TARN_PRIV_NONE
};
// Adds a share, or replaces the one of that name in its place. HLIBShareEnum keeps the order.
void AddShare(const Share& share);
void AddShare(const std::string& name, const std::string& path);
void RemoveShare(const std::string& name);
void SetPrivilege(const std::string& share, const std::string& user, int privilege);

struct User {
  std::string name;
  unsigned int uid = 0;
  unsigned int gid = 0;
  bool administrator = false;
};
// Adds an account, or replaces the one of that name. ResetCredentialsByName succeeds for unknown
// accounts too; for known ones it changes the ids where SetEffectiveIds of system_calls.h is in
// use.
void AddUser(const User& user);
void RemoveUser(const std::string& name);

// The longest directory given wins for TARNGetFSType.
void SetFSType(const std::string& directory, int type);
void SetRemoteFSType(int type);
void SetImageFSType(int type);
void AddMountPoint(const std::string& path);
// The directory and all below it.
void AddSnapshot(const std::string& directory);
void AddShareRecycle(const std::string& directory);
// The same for the home folder of an account of the kind `auth`, an AUTH_TYPE. The platform lists
// them in ascending order of the kinds and of the bytes.
void AddHomeRecycle(const std::string& directory, int auth = 0);
void AddHiddenDirName(const std::string& name);
// The permission bits on exactly this path.
void SetACLPerm(const std::string& path, int bits);
// What TARNQuotaIsEnough answers; a zero answer sets the platform's last error to `error`.
void SetQuota(bool enough, int error = 0);
void SetSpotlight(bool enabled);
bool SpotlightEnabled();

// What the index path functions answer: below the test's root, unless a test says otherwise by
// SetQueuePath and SetIndexPath. The directories that hold them exist.
std::string QueuePath(const std::string& share_path);
std::string IndexPath(const std::string& share_path);
std::string IndexID(const std::string& share_name);
void SetQueuePath(const std::string& share_path, const std::string& queue_path);
void SetIndexPath(const std::string& share_path, const std::string& index_path);

// Answers HLIBCExec and HLIBCExecl: program and arguments in, exit status out. 0 without one.
void OnExec(std::function<int(const std::vector<std::string>& command)> run);
// Answers TARN_CONTENT_EXTRACT_ParseFile; may throw. Without one: {"TARNMDPath": path}.
void OnParseFile(std::function<Json::Value(const std::string& path, const Json::Value& options)> f);

// What is registered with the monitor: configurations by application and queue file.
std::map<std::pair<std::string, std::string>, Json::Value> MonitorQueues();

// TARNFileCopy really copies (or moves) a source that exists, and succeeds without effect for one
// that does not.

// ---- The engine at the other end of a connection

// What was sent, in order.
std::vector<std::string> Requests();
std::vector<Json::Value> JsonRequests();
void ClearRequests();

// Queues the answer to one request. Answers are used up in order, before the handler is asked.
void QueueReply(const std::string& text);
void QueueReply(const Json::Value& reply);
// Answers requests for which nothing is queued; null fails the Recv. Without a handler the answer
// is {"success":true}.
void OnRequest(std::function<std::optional<std::string>(const Json::Value& request)> handler);

}  // namespace quarry::fake

#endif  // QUARRY_TESTS_FAKE_PLATFORM_FAKE_PLATFORM_H_
