// Which caches this process is updating.

#ifndef KELODRCORE_SRC_OWN_CLAIM_H_
#define KELODRCORE_SRC_OWN_CLAIM_H_

#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <thread>

namespace KeloDRCore {

// A cache, by whatever path it is reached, and the thread that updates it.
class OwnClaim {
 public:
  explicit OwnClaim(const std::string& path);
  ~OwnClaim();
  OwnClaim(const OwnClaim&) = delete;
  OwnClaim& operator=(const OwnClaim&) = delete;

  // From here to its end the claim is known in this process. Needs no memory.
  void Enlist();
  bool IsListed() const { return isListed; }

  // Whether the cache at `path` is being updated, by any thread of this process or by this one.
  enum class By { kAnyThread, kThisThread };
  static bool IsMade(By who, const std::string& path);

 private:
  bool IsOfSameCache(const OwnClaim& other) const;

  static OwnClaim* first;  // of the list, under Posix::forkMutex

  struct stat directory = {};
  const std::string name;
  const pid_t pid = getpid();
  const std::thread::id thread = std::this_thread::get_id();
  bool isListed = false;
  OwnClaim* next = nullptr;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_OWN_CLAIM_H_
