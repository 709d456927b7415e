// Documents written to any path in any small tree: only the file that the path names changes.
//
// An input is a tree (directories, files, links, hard links, queues; loops and links to nowhere
// among them) and a path. The kernel, opening the path, says which file it names.

#include <fcntl.h>
#include <kelodrcore/json_value.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <map>

#include "sandbox.h"

namespace {

namespace JsonValue = KeloDRCore::JsonValue;
namespace fs = std::filesystem;

constexpr uid_t kNobody = 65534;

// The root of the tree. The directory around it is nobody's to write: no path gets any further out.
const std::string& Root() {
  static const Sandbox sandbox;
  static const std::string root = sandbox.Path() + "/tree";
  static const bool isMade = mkdir(root.c_str(), 0755) == 0 &&
                             chmod(sandbox.Path().c_str(), 0555) == 0 &&
                             (geteuid() != 0 || chown(root.c_str(), kNobody, kNobody) == 0);
  Require(isMade, "the tree has a root");
  return root;
}

// An ordinary user in the tree.
class Visit {
 public:
  Visit() {
    Require((user != 0 || seteuid(kNobody) == 0) && chdir(Root().c_str()) == 0, "a user enters");
  }
  ~Visit() { Require(seteuid(user) == 0 && fchdir(start) == 0, "the user leaves"); }

 private:
  static inline const int start = open(".", O_PATH | O_CLOEXEC);
  const uid_t user = geteuid();
};

std::string TakeStep(FuzzedDataProvider& input) {
  static const std::string longest(NAME_MAX, 'l');
  static const std::string temporary = ".a.kelodr-" + std::to_string(geteuid());
  std::string odd = input.ConsumeRandomLengthString(8);
  std::replace(odd.begin(), odd.end(), '/', '.');
  if (odd == "..") odd = "";
  const std::string steps[] = {"a", "b", "c", "a/..", "b/..", ".", longest, temporary, odd};
  return steps[input.ConsumeIntegralInRange<size_t>(0, std::size(steps) - 1)];
}

std::string TakePath(FuzzedDataProvider& input) {
  std::string path = (input.ConsumeBool() ? "" : Root() + "/") + TakeStep(input);
  for (int more = input.ConsumeIntegralInRange(0, 3); more > 0; --more)
    path += "/" + TakeStep(input);
  return path;
}

// What cannot be made is not there.
void MakeEntry(FuzzedDataProvider& input) {
  const std::string path = TakePath(input);
  const bool isTemporary = path.find(".kelodr-") != std::string::npos;
  switch (input.ConsumeIntegralInRange(0, 5)) {
    case 0:
      if (!isTemporary) mkdir(path.c_str(), 0755);
      break;
    case 1:
      if (symlink(TakePath(input).c_str(), path.c_str()) != 0) return;
      break;
    case 2:
      if (link(TakePath(input).c_str(), path.c_str()) != 0) return;
      break;
    case 3:
      mkfifo(path.c_str(), 0644);
      break;
    default:
      close(open(path.c_str(), O_CREAT | O_EXCL | O_CLOEXEC, input.ConsumeBool() ? 0640 : 0444));
  }
}

// What is at each path: mode, and content or target.
using Tree = std::map<std::string, std::pair<mode_t, std::string>>;

Tree Look() {
  Tree tree;
  for (const auto& entry : fs::recursive_directory_iterator(Root())) {
    const std::string& path = entry.path().native();
    struct stat found = {};
    Require(lstat(path.c_str(), &found) == 0, "an entry is there");
    std::string& content = tree.try_emplace(path, found.st_mode, "").first->second.second;
    if (S_ISLNK(found.st_mode)) content = fs::read_symlink(path);
    if (S_ISREG(found.st_mode)) content = BytesOf(path);
  }
  return tree;
}

// The file that `path` names, or would name when it was made; empty when there is none or it is not
// a file.
std::string Resolve(const std::string& path, const Tree& tree) {
  if (path.find('\0') != std::string::npos) return "";
  int fd = open(path.c_str(), O_PATH | O_CLOEXEC);
  const bool isNew = fd < 0;
  if (isNew) fd = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0666);
  if (fd < 0) return "";
  struct stat found = {};
  const bool isFile = fstat(fd, &found) == 0 && S_ISREG(found.st_mode);
  const std::string name = fs::read_symlink("/proc/self/fd/" + std::to_string(fd));
  close(fd);
  if (isNew) Require(unlink(name.c_str()) == 0 && tree.count(name) == 0, "the tree is as before");
  return isFile ? name : "";
}

// Takes what a killed writer of `file` left out of the tree, as the next writer does. True when
// something was there.
bool EraseTemporary(const std::string& file, Tree& tree) {
  const size_t slash = file.rfind('/') + 1;
  return tree.erase(file.substr(0, slash) + "." + file.substr(slash, 100) + ".kelodr-" +
                    std::to_string(geteuid())) > 0;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  for (const auto& left : fs::directory_iterator(Root())) fs::remove_all(left.path());
  umask(022);
  const Visit visit;
  for (int entries = input.ConsumeIntegralInRange(0, 8); entries > 0; --entries) MakeEntry(input);
  const std::string path = TakePath(input);
  Tree expected = Look();
  const std::string file = Resolve(path, expected);
  const Json::Value document = input.ConsumeRemainingBytesAsString();

  const bool isWritten = JsonValue::toFile(document, path);
  Require(isWritten == !file.empty(), "a document is written where the kernel opens a file");
  if (isWritten) {
    // It may have been a link on the way to the file.
    const std::string way = EraseTemporary(file, expected) ? file : path;
    auto& [mode, content] = expected.try_emplace(file, S_IFREG | 0644, "").first->second;
    content = JsonValue::toString(document);
    Json::Value back;
    Require(!(mode & S_IRUSR) || (JsonValue::fromFile(back, way) && back == document),
            "it is read back");
  }
  Require(Look() == expected, "nothing else changes");
  return 0;
}
