// The ordinary user as an attacker: he puts whatever he likes wherever he may, while root works.

#ifndef KELODRCORE_TESTS_ATTACK_ATTACK_H_
#define KELODRCORE_TESTS_ATTACK_ATTACK_H_

#include <sys/stat.h>
#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

#include "support/clean_test.h"

inline constexpr uid_t kUser = 12345;

// In the /tmp of each attack.
inline constexpr char kSafeDir[] = "/tmp/safe";        // root's, mode 0700
inline constexpr char kSecret[] = "/tmp/safe/secret";  // the only file there, mode 0600
inline constexpr char kHome[] = "/tmp/home";           // the user's, mode 0755

using Names = std::vector<std::string>;

// Runs `body` as the user, without groups and without a way back, in a child that has to pass.
void AsUser(const std::function<void()>& body);

// Runs `step` as the user, again and again, from now to the end of this object.
class UserLoop {
 public:
  explicit UserLoop(const std::function<void()>& step);
  ~UserLoop();
  UserLoop(const UserLoop&) = delete;
  UserLoop& operator=(const UserLoop&) = delete;

 private:
  pid_t user;
};

// Runs `step` until the race has lasted long enough.
void Race(const std::function<void()>& step);

inline std::string SafePath(const std::string& name) { return kSafeDir + ("/" + name); }
inline std::string HomePath(const std::string& name) { return kHome + ("/" + name); }

void MakeDir(const std::string& path, mode_t mode, uid_t owner = 0);
void MakeLink(const std::string& target, const std::string& path);
void MakeQueue(const std::string& path);

struct stat LookAt(const std::string& path);
bool IsThere(const std::string& path);

// That of `path` itself, which must be a regular file.
void ExpectFile(const std::string& path, uid_t owner, mode_t mode);

class AttackTest : public CleanTest {
 protected:
  // Runs `body` as root in a child that sees a /tmp of its own, in which all may write. Nothing may
  // hang there, and the secret has to be as it was at the end. Skips the test without root, and
  // where root may not mount.
  static void Attack(const std::function<void()>& body);
};

#endif  // KELODRCORE_TESTS_ATTACK_ATTACK_H_
