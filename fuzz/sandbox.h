// A directory in memory for the files of a fuzz target.

#ifndef KELODRCORE_FUZZ_SANDBOX_H_
#define KELODRCORE_FUZZ_SANDBOX_H_

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include "fuzz.h"

// An empty directory, removed with what is in it at the end.
class Sandbox {
 public:
  Sandbox() { Require(mkdtemp(path.data()) != nullptr, "there is a directory in memory"); }
  ~Sandbox() {
    chmod(path.c_str(), 0700);
    std::filesystem::remove_all(path);
  }
  Sandbox(const Sandbox&) = delete;
  Sandbox& operator=(const Sandbox&) = delete;

  const std::string& Path() const { return path; }

 private:
  std::string path = "/dev/shm/kelodr-fuzz-XXXXXX";
};

inline void PutFile(const std::string& path, const std::string& bytes) {
  Require(bool(std::ofstream(path, std::ios::binary) << bytes), "a file is written");
}

inline std::string BytesOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

#endif  // KELODRCORE_FUZZ_SANDBOX_H_
