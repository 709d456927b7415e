#include "kelodrcore/file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <ios>
#include <limits>
#include <locale>
#include <memory>
#include <string_view>
#include <utility>

#include "json_text.h"
#include "kelocore.h"
#include "log.h"
#include "posix/descriptor.h"
#include "posix/file_io.h"
#include "posix/retry.h"
#include "privilege.h"

namespace KeloDRCore::File {
namespace {

struct StreamCloser {
  void operator()(FILE* stream) const { fclose(stream); }
};
using Stream = std::unique_ptr<FILE, StreamCloser>;

// What is at `path` may be anybody's: a queue without data is an error, and not waited for.
Posix::Descriptor OpenToRead(const std::string& path) {
  return Posix::Open(path, O_RDONLY | Posix::kHarmless);
}

// A directory opens like a file and counts as an empty one, as it does to std::ifstream. Anything
// else that is not a regular file may have no end.
bool ReadToEnd(const Posix::Descriptor& file, std::string& text) {
  struct stat found = {};
  if (!Posix::Stat(file.Get(), found)) return false;
  return S_ISDIR(found.st_mode) || (S_ISREG(found.st_mode) && Posix::ReadAll(file.Get(), text));
}

// What fgets makes of `text`: pieces of at most one line and 1023 bytes, of which a NUL byte hides
// the rest.
std::string JoinPieces(std::string_view text) {
  constexpr size_t kLongest = 1023;
  std::string joined;
  while (!text.empty()) {
    const size_t lineEnd = std::min(text.find('\n'), text.size() - 1) + 1;
    const std::string_view piece = text.substr(0, std::min(lineEnd, kLongest));
    joined += piece.substr(0, piece.find('\0'));
    text.remove_prefix(piece.size());
  }
  return joined;
}

// A path that begins with "-" would be an option to a program.
std::string AsArgument(const std::string& path) {
  return path.rfind('-', 0) == 0 ? "./" + path : path;
}

enum class WriteResult { kDone, kWriteFailed, kFlushFailed, kSyncFailed };

WriteResult WriteAndSync(FILE* stream, int fd, const Json::Value& value) {
  if (fprintf(stream, "%s", WriteJson(value).c_str()) < 0) {
    return WriteResult::kWriteFailed;
  }
  if (fflush(stream) != 0) return WriteResult::kFlushFailed;
  return Posix::Sync(fd) ? WriteResult::kDone : WriteResult::kSyncFailed;
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
  const Posix::Descriptor file = OpenToRead(path);
  if (!file.IsOpen()) {
    KELODR_LOG(ERR, __func__, "File[%s] is not opened.", path.c_str());
    return false;
  }
  std::string text;
  if (!IsRegularFile(file.Get()) || !Posix::ReadAll(file.Get(), text)) return false;
  text.erase(std::remove(text.begin(), text.end(), '\n'), text.end());
  return ParseJson(value, text, Origin::kFile);
}

bool Read(int fd, Json::Value& value) {
  const Stream stream(fdopen(fd, "r"));
  if (!stream) {
    KELODR_LOG(ERR, __func__, "Failed to open file descriptor [%d]", fd);
    return false;
  }
  std::string text;
  return Posix::ReadAll(fd, text) && ParseJson(value, JoinPieces(text), Origin::kFile);
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
    KELODR_LOG(ERR, __func__, "Failed to write [%s] to [%s].", WriteJson(value).c_str(),
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
    KELODR_LOG(ERR, __func__, "Failed to write [%s] to fd[%d]", WriteJson(value).c_str(), fd);
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
  if (KLIBCExec("/bin/mkdir", "-p", AsArgument(path).c_str(), "-m", modeText) != 0) {
    KELODR_LOG(ERR, __func__, "Failed to create dir [%s] with mode [%o]", path.c_str(), bits);
    return false;
  }
  return true;
}

bool RemoveDir(const std::string& path) {
  if (KLIBCFileCheckDir(path.c_str()) == 0) return true;
  return KLIBCExec("/bin/rm", "-rf", AsArgument(path).c_str(), nullptr, nullptr) == 0;
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

std::string_view SkipSpace(std::string_view text) {
  const auto* const begin = std::find_if_not(text.begin(), text.end(), IsSpace);
  return text.substr(static_cast<size_t>(begin - text.begin()));
}

// What `stream >> out` does with a text that is not empty, without a stream a text.
void Extract(std::string_view text, std::string& out) {
  const std::string_view rest = SkipSpace(text);
  if (!rest.empty()) out.assign(rest.begin(), std::find_if(rest.begin(), rest.end(), IsSpace));
}

// What turns the text of a value into text or a number: the standard facet reads numbers straight
// from it.
class ValueReader : private std::num_get<char, const char*> {
 public:
  ValueReader() : format(nullptr) { format.imbue(std::locale::classic()); }

  void Extract(std::string_view text, std::string& out) const { File::Extract(text, out); }

  void Extract(std::string_view text, double& out) { Get(SkipSpace(text), out); }

  void Extract(std::string_view text, int& out) {
    long wide = 0;
    Get(SkipSpace(text), wide);
    constexpr long kMin = std::numeric_limits<int>::min();
    constexpr long kMax = std::numeric_limits<int>::max();
    out = static_cast<int>(std::clamp(wide, kMin, kMax));
  }

 private:
  template <typename Number>
  void Get(std::string_view text, Number& number) {
    std::ios_base::iostate ignored = std::ios_base::goodbit;
    if (!text.empty()) get(text.data(), text.data() + text.size(), format, ignored, number);
  }

  std::basic_ios<char> format;  // where the facet looks for flags and locale
};

// `key` and `value` come in empty or 0.
template <typename V>
bool parseLineKeyValue(const std::string& line, ValueReader& reader, std::string& key, V& value) {
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
  const Posix::Descriptor file = OpenToRead(path);
  std::string text;
  if (!file.IsOpen() || !ReadToEnd(file, text)) {
    KELODR_LOG(WARN, __func__, "File[%s] is not opened.", path.c_str());
    return -1;
  }
  std::map<K, V> entries;  // apart from `map`, of which `path` may be a part
  ValueReader reader;
  for (size_t start = 0; start < text.size();) {
    const size_t end = std::min(text.find('\n', start), text.size());
    const std::string line = text.substr(start, end - start);
    start = end + 1;
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
  map = std::move(entries);
  return static_cast<int>(map.size());
}

template int Read(const std::string&, std::map<std::string, std::string>&);
template int Read(const std::string&, std::map<std::string, int>&);
template int Read(const std::string&, std::map<std::string, double>&);
template bool toType(const std::string&, std::string&, const std::string&);

}  // namespace KeloDRCore::File
