// Any bytes as the document of a cache and as its pid file, read and refreshed.
//
// An input is what stands at the two names (nothing, a file of this user or of another, a link, a
// directory), the bytes in it, the age of the document, how the fetch goes, and what the other
// process does while it is waited for.

#include <fcntl.h>
#include <kelodrcore/cache.h>
#include <kelodrcore/file_lock.h>
#include <kelodrcore/json_value.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <ctime>
#include <regex>
#include <sstream>

#include "sandbox.h"

namespace {

using KeloDRCore::Cache;
using KeloDRCore::FileLock;
namespace JsonValue = KeloDRCore::JsonValue;

constexpr long kTimeout = 100;
constexpr int kRetries = 2;

enum class Kind { kNothing, kOwn, kStrangers, kLink, kDirectory, kMaxValue = kDirectory };

struct Entry {
  Kind kind;
  std::string bytes;
  bool IsBelieved() const { return kind == Kind::kOwn; }
};

int pauses = 0;           // that the library made
int pausesOfUpdater = 0;  // with the last one another process would give its claim up

// What the locks of the cache leave below /tmp.
void RemoveLockDirectories(std::filesystem::path lowest) {
  std::error_code error;
  std::filesystem::remove_all(lowest, error);
  while (!error && (lowest = lowest.parent_path()) != "/tmp")
    std::filesystem::remove(lowest, error);
}

const std::string& Directory() {
  static const Sandbox sandbox;
  static const std::string& path = sandbox.Path();
  static const bool isCleaned =
      atexit([] { RemoveLockDirectories("/tmp/.kelodr_lock" + path); }) == 0;
  static const bool isLocked = FileLock(path + "/first").lock(LOCK_EX | LOCK_NB, 0);
  Require(isCleaned && isLocked, "/tmp/.kelodr_lock/dev/shm is missing or one's own");
  return path;
}

std::string Path() { return Directory() + "/a.cached"; }
std::string PidFile() { return Path() + ".pid"; }
std::string LinkedFile(const std::string& path) { return path + ".linked"; }

void Put(const std::string& path, const Entry& entry) {
  const bool isLink = entry.kind == Kind::kLink;
  if (entry.kind == Kind::kDirectory)
    Require(mkdir(path.c_str(), 0755) == 0, "a directory is made");
  if (entry.kind == Kind::kNothing || entry.kind == Kind::kDirectory) return;
  PutFile(isLink ? LinkedFile(path) : path, entry.bytes);
  if (isLink) Require(symlink(LinkedFile(path).c_str(), path.c_str()) == 0, "a link is made");
  if (entry.kind == Kind::kStrangers)
    Require(chown(path.c_str(), 1, 1) == 0, "a file is given away");
}

Entry TakeEntry(FuzzedDataProvider& input) {
  Entry entry = {input.ConsumeEnum<Kind>(), ""};
  if (entry.kind == Kind::kStrangers && geteuid() != 0) entry.kind = Kind::kOwn;
  return entry;
}

// When the process began, in the system's own unit; -1 for a process that is not there, or a
// zombie.
long long StartOf(int pid) {
  const std::string stat = BytesOf("/proc/" + std::to_string(pid) + "/stat");
  const size_t nameEnd = stat.rfind(')');
  if (nameEnd == std::string::npos) return -1;
  std::istringstream fields(stat.substr(nameEnd + 1));
  std::string field;
  for (int number = 3; number <= 22 && fields >> field; ++number) {
    if (field == "Z") return -1;
  }
  return std::stoll(field);
}

// The live process that a pid file of these bytes names, or 0.
int ProcessOf(const std::string& bytes) {
  static const std::regex form(R"(\s*0*([0-9]{1,10})(?:[ \t\r\v\f]*\n\s*0*([0-9]{1,19}))?\s*)");
  std::smatch parts;
  if (bytes.size() >= 128 || !std::regex_match(bytes, parts, form)) return 0;
  const long long pid = std::stoll(parts[1]);
  const long long start = pid > INT_MAX ? -1 : StartOf(int(pid));
  const bool isIt = start >= 0 && (!parts[2].matched || parts[2] == std::to_string(start));
  return isIt ? int(pid) : 0;
}

std::string TakePidBytes(FuzzedDataProvider& input) {
  if (input.ConsumeBool()) return input.ConsumeRandomLengthString();
  const int pid = input.PickValueInArray({getpid(), getppid(), 1});
  std::string text = std::to_string(pid);
  if (input.ConsumeBool()) text += "\n" + std::to_string(StartOf(pid));
  return text + input.ConsumeRandomLengthString(4);
}

class TestedCache : public Cache {
 public:
  TestedCache(bool isRequired, int failures)
      : Cache(Directory(), "a", kTimeout, isRequired, kRetries), failuresLeft(failures) {}
  Json::Value GetInfo() const override { return "fuzz"; }
  Json::Value GetDefaultValue() const override { return "default"; }
  bool IsValidData(const Json::Value& data) const override { return data.isObject(); }
  bool GetUpdatedData(Json::Value& out) const override {
    Require(ProcessOf(BytesOf(PidFile())) == getpid(), "the fetch is claimed");
    Require(Update(), "a fetch may read its own cache");
    out["fresh"] = true;
    return failuresLeft-- <= 0;
  }

 private:
  mutable int failuresLeft;
};

Json::Value Fresh() {
  Json::Value value;
  value["fresh"] = true;
  return value;
}

// What has to be answered.
struct Expected {
  Expected(const Entry& document, const Entry& pidFile, bool isRequired, long age, int failures) {
    Json::Value content;
    const bool isRead = document.IsBelieved() && JsonValue::fromFile(content, Path());
    const bool isObject = isRead && content.isObject();
    if (!isRead) data = "default";
    if (isObject && content.isMember("cached_data")) data = content["cached_data"];
    if (isObject && content["max_updated_time"].isInt())
      longest = content["max_updated_time"].asInt();
    isStale = !document.IsBelieved() || age > kTimeout;
    const bool isCurrent = !isStale && data.isObject();
    const int claimant = pidFile.IsBelieved() ? ProcessOf(pidFile.bytes) : 0;
    isClaimed = claimant > 0 && claimant != getpid();
    isUpdater = !isCurrent && (isRequired || !data.isObject()) && !isClaimed &&
                pidFile.kind != Kind::kDirectory;
    isFetched = isUpdater && document.kind != Kind::kDirectory && failures < kRetries + 2;
    result = isFetched ? Fresh() : data;
  }

  Json::Value data;    // of the document
  Json::Value result;  // of the reading
  int longest = 0;
  bool isStale;
  bool isClaimed;  // by another process
  bool isUpdater;
  bool isFetched;
};

}  // namespace

// In place of the system's: the library neither sleeps nor forks here.
extern "C" int usleep(useconds_t /*unused*/) {
  Require(++pauses < 100, "every wait ends");
  if (pauses == pausesOfUpdater) unlink(PidFile().c_str());
  return 0;
}
extern "C" pid_t fork() {
  errno = EAGAIN;
  return -1;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  Entry document = TakeEntry(input);
  Entry pidFile = TakeEntry(input);
  const bool isRequired = input.ConsumeBool();
  const int failures = input.ConsumeIntegralInRange(0, kRetries + 3);
  const int age = input.PickValueInArray({-1000, 10, 1000});
  const int patience = input.ConsumeIntegralInRange(1, 9);
  pidFile.bytes = TakePidBytes(input);
  document.bytes = input.ConsumeRemainingBytesAsString();
  for (const auto& left : std::filesystem::directory_iterator(Directory())) remove_all(left.path());
  Put(Path(), document);
  Put(PidFile(), pidFile);
  const timespec times[2] = {{time(nullptr) - age, 0}, {time(nullptr) - age, 0}};
  if (document.kind != Kind::kNothing) utimensat(AT_FDCWD, Path().c_str(), times, 0);
  const Expected expected(document, pidFile, isRequired, age, failures);

  pauses = 0;
  pausesOfUpdater = expected.isClaimed ? patience : 2 * (kRetries + 2);
  const TestedCache cache(isRequired, failures);
  Require(cache.IsTimeout() == expected.isStale, "the age is that of a believed document");
  Require(cache.GetMaxUpdateTime() == expected.longest,
          "the longest time is that of a believed document");
  Require(cache.GetCachedData() == expected.data, "the data is that of a believed document");
  Require(cache.Read() == expected.result, "what is read is fresh, the document's or the default");
  Require(pauses <= pausesOfUpdater, "nobody is waited for any longer");
  if (expected.isUpdater) Require(access(PidFile().c_str(), F_OK) != 0, "the claim is released");
  for (const auto& [path, entry] : {std::pair(Path(), document), std::pair(PidFile(), pidFile)}) {
    if (entry.kind == Kind::kLink)
      Require(BytesOf(LinkedFile(path)) == entry.bytes, "no link is followed");
  }
  for (const auto& left : std::filesystem::directory_iterator(Directory())) {
    Require(left.path().native().find("kelodr-", Directory().size()) == std::string::npos,
            "no temporary is left");
  }
  return 0;
}
