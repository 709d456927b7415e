#include "kelodrcore/file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <ext/stdio_filebuf.h>
#include <istream>
#include <limits>
#include <locale>
#include <memory>
#include <string_view>
#include <type_traits>
#include <utility>

#include "kelocore.h"
#include "kelodrcore/json_value.h"
#include "log.h"
#include "posix/retry.h"
#include "privilege.h"

namespace KeloDRCore::File {
namespace {

struct StreamCloser {
  void operator()(FILE* stream) const { fclose(stream); }
};
using Stream = std::unique_ptr<FILE, StreamCloser>;

// An input file stream with close-on-exec, which std::ifstream cannot set.
class InputFile {
 public:
  explicit InputFile(const std::string& path)
      : fd(Posix::Retry([&] { return open(path.c_str(), O_RDONLY | O_CLOEXEC); })),
        buffer(fd, std::ios::in),
        lines(&buffer) {
    // A buffer without a stream (no memory for one) does not own the descriptor.
    if (fd >= 0 && !buffer.is_open()) close(fd);
  }

  bool IsOpen() const { return buffer.is_open(); }
  bool NextLine(std::string& line) {
    errno = 0;
    if (std::getline(lines, line)) return true;
    // A directory opens like a file and counts as an empty one.
    isCut = lines.bad() && errno != EISDIR;
    return false;
  }
  // Whether the lines ended before the file did.
  bool IsCut() const { return isCut; }

 private:
  int fd;
  bool isCut = false;
  __gnu_cxx::stdio_filebuf<char> buffer;
  std::istream lines;
};

// fgets, except that an interrupted read is taken up again.
template <int kSize>
bool ReadChunk(FILE* stream, char (&chunk)[kSize]) {
  int length = 0;
  int byte = 0;
  while (length < kSize - 1 && byte != '\n' && (byte = Posix::GetByte(stream)) != EOF) {
    chunk[length++] = static_cast<char>(byte);
  }
  chunk[length] = '\0';
  return length > 0;
}

enum class WriteResult { kDone, kWriteFailed, kFlushFailed, kSyncFailed };

WriteResult WriteAndSync(FILE* stream, int fd, const Json::Value& value) {
  if (fprintf(stream, "%s", JsonValue::toString(value).c_str()) < 0) {
    return WriteResult::kWriteFailed;
  }
  if (fflush(stream) != 0) return WriteResult::kFlushFailed;
  return Posix::Retry([&] { return fsync(fd); }) == 0 ? WriteResult::kDone
                                                      : WriteResult::kSyncFailed;
}

}  // namespace

bool Read(const std::string& path, Json::Value& value) {
  if (path.empty()) {
    KELODR_LOG(ERR, __func__, "%s", "Invalid path");
    return false;
  }
  if (access(path.c_str(), F_OK) != 0) {
    KELODR_LOG(DEBUG, __func__, "file[%s] is not existed", path.c_str());
    return true;
  }
  InputFile file(path);
  if (!file.IsOpen()) {
    KELODR_LOG(ERR, __func__, "File[%s] is not opened.", path.c_str());
    return false;
  }
  std::string content;
  for (std::string line; file.NextLine(line);) content += line;
  // The start of a document can be a document itself, "12" of "123".
  return !file.IsCut() && JsonValue::fromString(value, content);
}

bool Read(int fd, Json::Value& value) {
  const Stream stream(fdopen(fd, "r"));
  if (!stream) {
    KELODR_LOG(ERR, __func__, "Failed to open file descriptor [%d]", fd);
    return false;
  }
  std::string content;
  char chunk[1024];
  while (ReadChunk(stream.get(), chunk)) content += chunk;
  return ferror(stream.get()) == 0 && JsonValue::fromString(value, content);
}

bool Write(const std::string& path, const Json::Value& value) {
  if (path.empty()) {
    KELODR_LOG(ERR, __func__, "%s", "Empty path to write.");
    return false;
  }
  const Stream stream(Posix::Retry([&] { return fopen(path.c_str(), "we"); }));
  if (!stream) {
    KELODR_LOG(ERR, __func__, "Failed to open file [%s]", path.c_str());
    return false;
  }
  const WriteResult result = WriteAndSync(stream.get(), fileno(stream.get()), value);
  if (result == WriteResult::kWriteFailed) {
    KELODR_LOG(ERR, __func__, "Failed to write [%s] to [%s].", JsonValue::toString(value).c_str(),
               path.c_str());
  } else if (result == WriteResult::kFlushFailed) {
    KELODR_LOG(ERR, __func__, "Failed to flush file[%s]", path.c_str());
  } else if (result == WriteResult::kSyncFailed) {
    KELODR_LOG(ERR, __func__, "Failed to sync file [%s]", path.c_str());
  }
  return result == WriteResult::kDone;
}

bool Write(int fd, const Json::Value& value) {
  const Stream stream(fdopen(fd, "w"));
  if (!stream) {
    KELODR_LOG(ERR, __func__, "Failed to open file descriptor [%d]", fd);
    return false;
  }
  const WriteResult result = WriteAndSync(stream.get(), fd, value);
  if (result == WriteResult::kWriteFailed) {
    KELODR_LOG(ERR, __func__, "Failed to write [%s] to fd[%d]", JsonValue::toString(value).c_str(),
               fd);
  } else if (result == WriteResult::kFlushFailed) {
    KELODR_LOG(ERR, __func__, "%s", "Failed to flush file");
  } else if (result == WriteResult::kSyncFailed) {
    KELODR_LOG(ERR, __func__, "%s", "Failed to sync file");
  }
  return result == WriteResult::kDone;
}

bool CreateDir(const std::string& path, int mode) {
  if (path.empty()) return false;
  if (KLIBCFileCheckDir(path.c_str()) == 1) return true;

  const auto bits = static_cast<unsigned int>(mode);
  if (mode > 0777) {
    KELODR_LOG(ERR, __func__, "Directory mode error: %o", bits);
    return false;
  }
  char modeText[4];
  if (snprintf(modeText, sizeof(modeText), "%o", bits) >= static_cast<int>(sizeof(modeText))) {
    KELODR_LOG(ERR, __func__, "snprintf error with mode [%o]", bits);
    return false;
  }

  KELODR_PRIVILEGED();
  if (KLIBCExec("/bin/mkdir", "-p", path.c_str(), "-m", modeText) != 0) {
    KELODR_LOG(ERR, __func__, "Failed to create dir [%s] with mode [%o]", path.c_str(), bits);
    return false;
  }
  return true;
}

bool RemoveDir(const std::string& path) {
  if (KLIBCFileCheckDir(path.c_str()) == 0) return true;
  return KLIBCExec("/bin/rm", "-rf", path.c_str(), nullptr, nullptr) == 0;
}

std::string GetParentDir(const std::string& path) { return path.substr(0, path.rfind('/')); }

bool IsRegularFile(int fd) {
  struct stat status = {};
  return fd >= 0 && fstat(fd, &status) == 0 && S_ISREG(status.st_mode);
}

namespace {

constexpr char kSeparator[] = "=";

// White space of the classic locale.
bool IsSpace(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

std::string_view SkipSpace(std::string_view text) {
  const auto* const begin = std::find_if_not(text.begin(), text.end(), IsSpace);
  return text.substr(static_cast<size_t>(begin - text.begin()));
}

// What `stream >> out` does with a text that is not empty, without a stream a text.
void Extract(std::string_view text, std::string& out) {
  const std::string_view rest = SkipSpace(text);
  if (!rest.empty()) out.assign(rest.begin(), std::find_if(rest.begin(), rest.end(), IsSpace));
}

// The same for numbers, by the standard facet reading straight from the text.
class NumberReader : private std::num_get<char, const char*> {
 public:
  NumberReader() : format(nullptr) { format.imbue(std::locale::classic()); }

  void Extract(std::string_view text, int& out) {
    const auto wide = Get<long>(SkipSpace(text));
    constexpr long kMin = std::numeric_limits<int>::min();
    constexpr long kMax = std::numeric_limits<int>::max();
    out = static_cast<int>(std::clamp(wide, kMin, kMax));
  }

  void Extract(std::string_view text, double& out) {
    const std::string_view rest = SkipSpace(text);
    // A plain number is one to both and read faster; the facet knows what the rest means.
    const char* const end = rest.data() + rest.size();
    const auto [stop, error] = std::from_chars(rest.data(), end, out);
    const bool plain = error == std::errc() && IsDigit(stop[-1]) && (stop == end || IsSpace(*stop));
    if (!plain) out = Get<double>(rest);
  }

 private:
  template <typename Number>
  Number Get(std::string_view text) {
    Number number = 0;
    std::ios_base::iostate ignored = std::ios_base::goodbit;
    if (!text.empty()) get(text.data(), text.data() + text.size(), format, ignored, number);
    return number;
  }

  std::basic_ios<char> format;  // where the facet looks for flags and locale
};

// What turns the text of a value into a `V`.
struct WordReader {
  static void Extract(std::string_view text, std::string& out) { File::Extract(text, out); }
};
template <typename V>
using ReaderOf = std::conditional_t<std::is_arithmetic_v<V>, NumberReader, WordReader>;

// `key` and `value` come in empty or 0.
template <typename V>
bool parseLineKeyValue(const std::string& line, ReaderOf<V>& reader, std::string& key, V& value) {
  if (line.empty()) {
    KELODR_LOG(WARN, __func__, "%s", "Bad Parameter.");
    return false;
  }
  const size_t end = line.find(kSeparator);
  if (end == std::string::npos) {
    KELODR_LOG(NOTICE, __func__, "Cannot find separator[%s] in line[%s]", kSeparator, line.c_str());
    return false;
  }
  const std::string_view whole(line);
  const std::string_view keyText = whole.substr(0, end);
  const std::string_view valueText = whole.substr(end + 1);
  if (keyText.empty() || valueText.empty()) return false;
  Extract(keyText, key);
  reader.Extract(valueText, value);
  return true;
}

}  // namespace

template <typename K, typename V>
bool toType(const K& text, V& out, const V& defaultValue) {
  if (text.empty()) {
    out = defaultValue;
    return false;
  }
  Extract(text, out);
  return true;
}

template <typename K, typename V>
int Read(const std::string& path, std::map<K, V>& map) {
  if (path.empty()) {
    KELODR_LOG(ERR, __func__, "%s", "Invalid path");
    return -1;
  }
  if (access(path.c_str(), F_OK) != 0) return 0;
  InputFile file(path);
  if (!file.IsOpen()) {
    KELODR_LOG(WARN, __func__, "File[%s] is not opened.", path.c_str());
    return -1;
  }
  std::map<K, V> entries;  // apart from `map`, of which `path` may be a part
  ReaderOf<V> reader;
  for (std::string line; file.NextLine(line);) {
    K key{};
    V value{};
    if (parseLineKeyValue(line, reader, key, value)) {
      // Most files are sorted: look at the end first.
      entries.insert_or_assign(entries.end(), std::move(key), std::move(value));
    } else {
      KELODR_LOG(NOTICE, __func__, "Failed to parse line[%s] from file [%s]", line.c_str(),
                 path.c_str());
    }
  }
  if (file.IsCut()) {
    KELODR_LOG(WARN, __func__, "File[%s] is not opened.", path.c_str());
    return -1;
  }
  map = std::move(entries);
  return static_cast<int>(map.size());
}

template int Read(const std::string&, std::map<std::string, std::string>&);
template int Read(const std::string&, std::map<std::string, int>&);
template int Read(const std::string&, std::map<std::string, double>&);
template bool toType(const std::string&, std::string&, const std::string&);

}  // namespace KeloDRCore::File
