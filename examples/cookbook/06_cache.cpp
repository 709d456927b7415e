#include <kelodrcore/cache.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iostream>

using namespace KeloDRCore;

// The kernel's release, as a command tells it that takes its time.
class Release : public Cache {
 public:
  explicit Release(const std::string& dir)
      : Cache(dir, "release", 3600, false, 3) {}  // stale after an hour, then refreshed behind us

  Json::Value GetInfo() const override { return "release"; }

  bool GetUpdatedData(Json::Value& out) const override {
    ++runs;
    FILE* const command = popen("sleep 0.3; uname -r", "re");
    if (command == nullptr) return false;
    char line[256];
    const bool hasLine = fgets(line, sizeof line, command) != nullptr;
    if (pclose(command) != 0 || !hasLine) return false;
    out["release"] = std::string(line, strcspn(line, "\n"));
    return true;
  }

  bool IsValidData(const Json::Value& data) const override {
    return data.isObject() && data["release"].isString();
  }

  mutable int runs = 0;
};

void Ask(const char* who, const Release& release) {
  const bool isGood = release.IsValidData(release.Read());
  std::cout << who << ": " << (isGood ? "an answer" : "no answer") << ", " << release.runs
            << " run(s) of the command\n";
}

int main() {
  // An absolute path: the name of the cache's lock is made of it.
  const std::string dir = std::filesystem::absolute("cache").string();
  const Release first(dir);
  Ask("the first reader waits", first);
  Ask("and is answered from memory then", first);
  const Release second(dir);
  Ask("another one reads the file", second);
}
