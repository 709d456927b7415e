// The reader of key=value files, and the bracket of raised ids around the making of a directory.

#ifndef KELODRCORE_TESTS_MODEL_FILES_H_
#define KELODRCORE_TESTS_MODEL_FILES_H_

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <locale>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "kelodrcore/file.h"
#include "model/twin.h"
#include "support/special_files.h"

namespace Model {

constexpr const char* kFile = "file.cpp";

class KeyValueFile {
 public:
  template <typename V>
  static int Read(const std::string& path, std::map<std::string, V>& map) {
    if (path.empty()) {
      Trace::Log(Err, kFile, "Read", "Invalid path");
      return -1;
    }
    if (access(path.c_str(), F_OK) != 0) return 0;
    std::ifstream file(path);
    if (!file.is_open()) {
      Trace::Log(Warn, kFile, "Read", "File[%s] is not opened.", path.c_str());
      return -1;
    }
    map.clear();
    std::string line;
    while (std::getline(file, line)) {
      std::string key;
      V value{};
      if (ParseLine(line, key, value)) {
        map[key] = value;
      } else {
        Trace::Log(Notice, kFile, "Read", "Failed to parse line[%s] from file [%s]", line.c_str(),
                   path.c_str());
      }
    }
    return static_cast<int>(map.size());
  }

  template <typename T>
  static bool ToType(const std::string& text, T& out, const T& byDefault) {
    if (text.empty()) {
      out = byDefault;
      return false;
    }
    std::istringstream stream(text);
    stream.imbue(std::locale::classic());
    stream >> out;
    return true;
  }

 private:
  template <typename V>
  static bool ParseLine(const std::string& line, std::string& key, V& value) {
    if (line.empty()) {
      Trace::Log(Warn, kFile, "parseLineKeyValue", "Bad Parameter.");
      return false;
    }
    const size_t at = line.find('=');
    if (at == std::string::npos) {
      Trace::Log(Notice, kFile, "parseLineKeyValue", "Cannot find separator[%s] in line[%s]", "=",
                 line.c_str());
      return false;
    }
    return ToType<std::string>(line.substr(0, at), key, "") &&
           ToType<V>(line.substr(at + 1), value, V{});
  }
};

class Directory {
 public:
  static bool Create(const std::string& path, int mode) {
    if (path.empty()) return false;
    if (std::filesystem::is_directory(path)) return true;
    const auto bits = static_cast<unsigned int>(mode);
    char text[4];
    if (mode > 0777) {
      Trace::Log(Err, kFile, "CreateDir", "Directory mode error: %o", bits);
      return false;
    }
    if (snprintf(text, sizeof text, "%o", bits) >= 4) {
      Trace::Log(Err, kFile, "CreateDir", "snprintf error with mode [%o]", bits);
      return false;
    }
    const Calls::Ids saved = {geteuid(), getegid()};
    Finish(Enter(saved), "ENTER");
    std::error_code error;
    std::filesystem::create_directories(path, error);
    if (error) {
      Trace::Log(Err, kFile, "CreateDir", "Failed to create dir [%s] with mode [%o]", path.c_str(),
                 bits);
    } else {
      std::filesystem::permissions(path, std::filesystem::perms(mode));
    }
    Finish(Leave(saved), "LEAVE");
    return !error;
  }

 private:
  static bool Enter(const Calls::Ids& saved) {
    return (saved.gid == 0 || SetGid(0)) && (saved.uid == 0 || SetUid(0));
  }

  static bool Leave(const Calls::Ids& saved) {
    const bool isUidOther = geteuid() != saved.uid;
    const bool isGidOther = getegid() != saved.gid;
    if (!isUidOther && !isGidOther) return true;
    if (isUidOther && !SetUid(0)) return false;
    if (isGidOther && !SetGid(saved.gid)) return false;
    return !isUidOther || SetUid(saved.uid);
  }

  static bool SetUid(unsigned int id) {
    const auto kept = static_cast<uid_t>(-1);
    return Report(setresuid(kept, id, kept) == 0, "resuid", id);
  }
  static bool SetGid(unsigned int id) {
    const auto kept = static_cast<gid_t>(-1);
    return Report(setresgid(kept, id, kept) == 0, "resgid", id);
  }

  static bool Report(bool isSet, const char* word, unsigned int id) {
    const std::string call =
        "set" + std::string(word) + "(-1, " + std::to_string(int(id)) + ", -1)";
    if (!isSet) AddLine(LOG_ERR, "ERROR: " + call + " [Operation not permitted]");
    if (isSet && id == 0) AddLine(LOG_DEBUG, "WARNING: " + call);
    return isSet;
  }
  static void Finish(bool isDone, const char* step) {
    if (!isDone) AddLine(LOG_ERR, std::string("ERROR: ") + step + "CriticalSection");
    errno = isDone ? 0 : EPERM;
  }
  static void AddLine(int priority, const std::string& text) {
    std::ostringstream line;
    line << Auth(LOG_AUTH | priority, std::string(kFile) + " " + text);
    Trace::Add(line.str());
  }
};

}  // namespace Model

class Files {
 public:
  explicit Files(const std::string& itsDir) : dir(itsDir) { MakeSocket(dir + "/socket"); }

  void Step() {
    switch (Draw::Below(20)) {
      case 0:
      case 10:
      case 11:
        return OfDirectory();
      case 1:
        return OfWord();
      case 2:
      case 3:
      case 4:
        return OfFile(integers);
      case 5:
      case 6:
      case 7:
        return OfFile(reals);
      default:
        return OfFile(texts);
    }
  }

 private:
  static std::string Line() {
    static const std::vector<std::string> pieces = {"a",
                                                    "b",
                                                    "key",
                                                    "=",
                                                    "=",
                                                    " ",
                                                    "\t",
                                                    "1",
                                                    "-7",
                                                    "0x1f",
                                                    "1.5",
                                                    "1e3",
                                                    ".",
                                                    "abc",
                                                    "#c",
                                                    "2147483648",
                                                    "-99999999999",
                                                    "1e999",
                                                    "-1e999",
                                                    "1e-999",
                                                    "nan",
                                                    "inf",
                                                    "+5",
                                                    "'",
                                                    "%s",
                                                    "\r",
                                                    "\xc3\xa9",
                                                    "1,5",
                                                    "1e",
                                                    "--1",
                                                    "\v\f",
                                                    std::string("\0", 1)};
    static const std::vector<std::string> starts = {"", "", "a=", "b=", " a ="};
    std::string line = Draw::Of(starts);
    for (size_t i = Draw::Below(6); i > 0; --i) line += Draw::Of(pieces);
    return line;
  }

  template <typename V>
  void OfFile(Twin<std::map<std::string, V>, std::map<std::string, V>>& map) {
    static const std::vector<std::string> names = {"/lines", "/lines", "/lines", "/lines",
                                                   "/lines", "/none",  "/socket"};
    const std::string path = Draw::Once(15) ? "" : dir + Draw::Of(names);
    std::string content;
    for (size_t i = Draw::Below(6); i > 0; --i) content += Line() + "\n";
    if (Draw::Once(3)) content += Line();
    std::ofstream(dir + "/lines") << content;
    Do("read [" + content + "]", [&](auto side) {
      std::string shown = Show(Read(side, path, side(map)));
      for (const auto& [key, value] : side(map)) shown += Show(key) + "=" + Show(value) + ";";
      return shown;
    });
  }
  template <typename V>
  static int Read(Library /*side*/, const std::string& path, std::map<std::string, V>& map) {
    return KeloDRCore::File::Read(path, map);
  }
  template <typename V>
  static int Read(Modelled /*side*/, const std::string& path, std::map<std::string, V>& map) {
    return Model::KeyValueFile::Read(path, map);
  }

  static void OfWord() {
    const std::string text = Line();
    const std::string byDefault = Draw::Name();
    Do("toType [" + text + "]", [&](auto /*side*/) {
      std::string out = "old";
      const bool result =
          Trace::IsModel()
              ? Model::KeyValueFile::ToType<std::string>(text, out, byDefault)
              : KeloDRCore::File::toType<std::string, std::string>(text, out, byDefault);
      return Show(result, out);
    });
  }

  void OfDirectory() {
    static const std::vector<std::string> names = {"/made",      "/made/in",   "/made/in/it",
                                                   "/two words", "/socket/no", "/made"};
    static const std::vector<int> modes = {0755, 0700, 0777, 0, 07, 01000, 01777, -1, 0750};
    static const std::vector<unsigned int> ids = {0, 0, 1000, 65534};
    const std::string path = Draw::Once(9) ? "" : dir + Draw::Of(names);
    const int mode = Draw::Of(modes);
    Calls::ids = {Draw::Of(ids), Draw::Of(ids)};
    if (Draw::Once(2)) {
      Calls::fault = {"setres", int(Draw::Below(5)), int(Draw::Below(4)) + 1, 0, false};
    }
    const bool isThere = Draw::Once(6);
    const bool isBracketed = !isThere && !path.empty() && mode >= 0 && mode <= 0777;
    Do("make " + path, [&](auto /*side*/) {
      if (isThere) std::filesystem::create_directory(dir + "/made");
      const bool result = Trace::IsModel() ? Model::Directory::Create(path, mode)
                                           : KeloDRCore::File::CreateDir(path, mode);
      const int error = errno;
      std::string shown = Show(result, geteuid(), getegid());
      if (isBracketed) shown += " " + Show(error);
      struct stat status {};
      if (stat(path.c_str(), &status) == 0) shown += " " + Show(status.st_mode & 07777U);
      chmod(path.c_str(), 0700);  // so that anybody can remove it
      std::filesystem::remove_all(dir + "/made");
      std::filesystem::remove_all(dir + "/two words");
      return shown;
    });
    Calls::fault = {};
    Calls::ids = {};
  }

  std::string dir;
  Twin<std::map<std::string, std::string>, std::map<std::string, std::string>> texts;
  Twin<std::map<std::string, int>, std::map<std::string, int>> integers;
  Twin<std::map<std::string, double>, std::map<std::string, double>> reals;
};

#endif  // KELODRCORE_TESTS_MODEL_FILES_H_
