// Files of JSON and of key=value lines.

#include <fcntl.h>

#include <fstream>
#include <map>

#include "growth/operations.h"
#include "growth/texts.h"
#include "kelodrcore/file.h"
#include "kelodrcore/json_value.h"

namespace {

namespace File = KeloDRCore::File;
namespace JsonValue = KeloDRCore::JsonValue;

std::string FileOf(const std::string& text) {
  const std::string path = Path("file");
  std::ofstream(path) << text;
  return path;
}

Work Read(bool (*read)(const std::string&, Json::Value&), const std::string& text) {
  return [=, path = FileOf(text)] {
    Json::Value value;
    Require(read(path, value) && !value.empty(), "reading");
  };
}

Work Write(bool (*write)(const std::string&, const Json::Value&), size_t count) {
  return [=, value = Members(count)] { Require(write(Path("file"), value), "writing"); };
}

bool FromFile(const std::string& path, Json::Value& value) {
  return JsonValue::fromFile(value, path);
}

bool ToFile(const std::string& path, const Json::Value& value) {
  return JsonValue::toFile(value, path);
}

bool ReadDescriptor(const std::string& path, Json::Value& value) {
  return File::Read(open(path.c_str(), O_RDONLY | O_CLOEXEC), value);
}

bool WriteDescriptor(const std::string& path, const Json::Value& value) {
  return File::Write(open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600), value);
}

// A line for each of `count` entries, which are `entries` in the end.
template <typename V>
Work ReadLines(const std::string& text, size_t entries) {
  return [=, path = FileOf(text)] {
    std::map<std::string, V> map;
    Require(File::Read(path, map) == static_cast<int>(entries), "reading lines");
  };
}

std::string Lines(size_t count) {
  std::string text;
  for (size_t i = 0; i < count; ++i) text += Name(i, count) + " = 12\n";
  return text;
}

}  // namespace

void AddFiles(std::vector<Operation>& operations) {
  const auto add = [&](const char* name, size_t size, const std::function<Work(size_t)>& prepared) {
    operations.push_back({name, size, prepared});
  };
  add("fromFile", 128, [](size_t n) { return Read(FromFile, MembersText(n)); });
  add("toFile", 128, [](size_t n) { return Write(ToFile, n); });
  add("File::Read", 128, [](size_t n) { return Read(File::Read, MembersText(n)); });
  add("File::Read of many line ends", 32768,
      [](size_t n) { return Read(File::Read, "[1" + Repeated(n, "\n") + "]"); });
  add("File::Read of a descriptor", 128,
      [](size_t n) { return Read(ReadDescriptor, MembersText(n)); });
  add("File::Read of a descriptor, one line", 8192,
      [](size_t n) { return Read(ReadDescriptor, "[\"" + Repeated(n, "x") + "\"]"); });
  add("File::Read of a descriptor, many line ends", 8192,
      [](size_t n) { return Read(ReadDescriptor, "[1" + Repeated(n, "\n") + "]"); });
  add("File::Write", 512, [](size_t n) { return Write(File::Write, n); });
  add("File::Write of a descriptor", 512, [](size_t n) { return Write(WriteDescriptor, n); });
  add("File::Read<K, V> of texts", 512,
      [](size_t n) { return ReadLines<std::string>(Lines(n), n); });
  add("File::Read<K, V> of integers", 512, [](size_t n) { return ReadLines<int>(Lines(n), n); });
  add("File::Read<K, V> of one long line", 16384,
      [](size_t n) { return ReadLines<std::string>("a=" + Repeated(n, "x"), 1); });
  add("File::Read<K, V> of one line of separators", 16384,
      [](size_t n) { return ReadLines<std::string>("a=" + Repeated(n, "="), 1); });
  add("File::Read<K, V> of one line of blanks", 16384,
      [](size_t n) { return ReadLines<double>("a=" + Repeated(n, " "), 1); });
  add("File::Read<K, V> of digits", 16384,
      [](size_t n) { return ReadLines<double>("a=" + Repeated(n, "1"), 1); });
  // Lines of 64 bytes: the buffer has 4 KiB at least.
  add("File::Read<K, V> of one name again and again", 512,
      [](size_t n) { return ReadLines<int>(Repeated(n, std::string(60, ' ') + "a=1\n"), 1); });
  add("File::Read<K, V> of empty lines", 512, [](size_t n) {
    return ReadLines<int>(Repeated(n, "a=1" + Repeated(8, "\n") + std::string(52, ' ') + "\n"), 1);
  });
  add("File::Read<K, V> of lines without a separator", 512,
      [](size_t n) { return ReadLines<int>(Repeated(n, std::string(63, 'x') + "\n"), 0); });
}
