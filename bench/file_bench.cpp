// File::Read and File::Write of JSON documents, and of key=value text.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <charconv>
#include <cstring>
#include <fstream>
#include <map>
#include <sstream>

#include "kelodrcore/file.h"
#include "support.h"

namespace bench {
namespace {

constexpr size_t kDocumentSize = 1 << 20;
constexpr int kLines = 100000;

std::string ReadRaw(const std::string& path) {
  std::string text;
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  struct stat status = {};
  Require(fd >= 0 && fstat(fd, &status) == 0, "cannot open " + path);
  text.resize(static_cast<size_t>(status.st_size));
  size_t length = 0;
  while (length < text.size()) {
    const ssize_t count = read(fd, text.data() + length, text.size() - length);
    Require(count > 0, "cannot read " + path);
    length += static_cast<size_t>(count);
  }
  close(fd);
  return text;
}

bool WriteRaw(const std::string& path, const std::string& text) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
  size_t length = 0;
  while (length < text.size()) {
    const ssize_t count = write(fd, text.data() + length, text.size() - length);
    if (count <= 0) break;
    length += static_cast<size_t>(count);
  }
  const bool synced = length == text.size() && fsync(fd) == 0;
  close(fd);
  return synced;
}

void RegisterDocumentRead() {
  const std::string path = ScratchPath("read.json");
  WriteWhole(path, NodesDocument(kDocumentSize));
  Register("File::Read", "JSON, 1 MiB", kLibrary, [=](benchmark::State& state) {
    for (auto _ : state) {
      Json::Value value;
      Require(KeloDRCore::File::Read(path, value) && value.isArray(), "File::Read");
    }
  });
  Register("File::Read", "JSON, 1 MiB", Baseline(1.15), [=](benchmark::State& state) {
    for (auto _ : state) {
      Json::Value value;
      Require(access(path.c_str(), F_OK) == 0 && ParseWithJsonCpp(ReadRaw(path), value), "read");
    }
  });
}

// Real time: most of it is the disk's.
void RegisterDocumentWrite() {
  Json::Value value;
  ParseWithJsonCpp(NodesDocument(kDocumentSize), value);
  const std::string path = ScratchPath("write.json");
  Register("File::Write", "JSON, 1 MiB", kLibrary, [=](benchmark::State& state) {
    for (auto _ : state) Require(KeloDRCore::File::Write(path, value), "File::Write");
  })->UseRealTime();
  Register("File::Write", "JSON, 1 MiB", Baseline(1.15), [=](benchmark::State& state) {
    for (auto _ : state) Require(WriteRaw(path, WriteWithJsonCpp(value)), "write");
  })->UseRealTime();
}

// Names in order, as programs write them, or in none. Blanks around some separators.
std::string KeyValueLines(bool inOrder, bool numbers) {
  std::string text;
  for (int i = 0; i < kLines; ++i) {
    char line[64];
    const int name = inOrder ? i : static_cast<int>(i * 7919LL % kLines);
    snprintf(line, sizeof(line), "key_%06d%s%s%d%s\n", name, i % 4 != 0 ? "=" : " = ",
             numbers ? "" : "value_", i * 31, i % 2 != 0 ? ".5" : "");
    text += line;
  }
  return text;
}

// A stream object for each token, as the rules of conversion are told.

template <typename T>
void FromStream(const std::string& token, T& out) {
  std::stringstream stream;
  stream << token;
  stream >> out;
}

template <typename V>
void ReadWithStreams(const std::string& path, std::map<std::string, V>& map) {
  std::ifstream file(path);
  for (std::string line; std::getline(file, line);) {
    const size_t separator = line.find('=');
    if (separator == std::string::npos) continue;
    std::string key;
    V value{};
    FromStream(line.substr(0, separator), key);
    FromStream(line.substr(separator + 1), value);
    map[key] = value;
  }
}

// The hand-written scan: the whole file in one buffer, pointers into it.

bool IsSpace(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

void NarrowToWord(const char*& begin, const char*& end) {
  while (begin != end && IsSpace(*begin)) ++begin;
  const char* at = begin;
  while (at != end && !IsSpace(*at)) ++at;
  end = at;
}

void FromWord(const char* begin, const char* end, std::string& out) { out.assign(begin, end); }

void FromWord(const char* begin, const char* /*end*/, int& out) {
  out = static_cast<int>(strtol(begin, nullptr, 10));
}

void FromWord(const char* begin, const char* /*end*/, double& out) { out = strtod(begin, nullptr); }

template <typename V>
void ReadByHand(const std::string& path, std::map<std::string, V>& map) {
  const std::string text = ReadRaw(path);
  const char* const end = text.data() + text.size();
  for (const char* line = text.data(); line < end;) {
    const auto find = [end](const char* from, const char* to, char c) {
      const void* found = memchr(from, c, static_cast<size_t>(to - from));
      return found != nullptr ? static_cast<const char*>(found) : end;
    };
    const char* const lineEnd = find(line, end, '\n');
    const char* keyEnd = find(line, lineEnd, '=');
    if (keyEnd != end) {
      const char* valueBegin = keyEnd + 1;
      const char* valueEnd = lineEnd;
      NarrowToWord(line, keyEnd);
      NarrowToWord(valueBegin, valueEnd);
      V value{};
      FromWord(valueBegin, valueEnd, value);
      map[std::string(line, keyEnd)] = std::move(value);
    }
    line = lineEnd + 1;
  }
}

template <typename V, typename Read>
void MeasureLines(const std::string& work, const Contestant& contestant, const std::string& path,
                  const Read& read) {
  Register("File::Read<K, V>", work, contestant, [=](benchmark::State& state) {
    std::map<std::string, V> expected;
    ReadByHand(path, expected);
    std::map<std::string, V> first;
    read(path, first);
    Require(first == expected, "the entries differ");
    for (auto _ : state) {
      std::map<std::string, V> map;
      read(path, map);
    }
  })->Unit(benchmark::kMillisecond);
}

template <typename V>
void RegisterLines(const std::string& type, bool inOrder) {
  const std::string work = "100,000 lines, " + type + (inOrder ? "" : ", names in no order");
  const std::string path = ScratchPath(type + (inOrder ? ".conf" : ".unordered.conf"));
  WriteWhole(path, KeyValueLines(inOrder, std::is_arithmetic_v<V>));
  MeasureLines<V>(work, kLibrary, path, KeloDRCore::File::Read<std::string, V>);
  MeasureLines<V>(work, Baseline(1.5), path, ReadByHand<V>);
  MeasureLines<V>(work, {"a stream a token", 0.25}, path, ReadWithStreams<V>);
}

const Benchmarks registered([] {
  RegisterDocumentRead();
  RegisterDocumentWrite();
  for (const bool inOrder : {true, false}) {
    RegisterLines<std::string>("text", inOrder);
    RegisterLines<int>("int", inOrder);
    RegisterLines<double>("double", inOrder);
  }
});

}  // namespace
}  // namespace bench
