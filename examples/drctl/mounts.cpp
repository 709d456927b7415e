#include "mounts.h"

#include <sys/statvfs.h>

#include <algorithm>
#include <ctime>
#include <fstream>
#include <limits>
#include <map>
#include <sstream>
#include <string>

namespace drctl {

using KeloDRCore::SqliteValueList;

namespace {

struct Mount {
  std::string device;
  std::string fsType;
};

// The kernel writes blank, tab, newline and backslash as a backslash and three octal digits.
std::string Unescape(const std::string& text) {
  std::string result;
  for (size_t i = 0; i < text.size(); ++i) {
    const bool isEscape = text[i] == '\\' && i + 3 < text.size() &&
                          text.find_first_not_of("01234567", i + 1) >= i + 4;
    if (!isEscape) {
      result += text[i];
      continue;
    }
    result += static_cast<char>(std::stoi(text.substr(i + 1, 3), nullptr, 8));
    i += 3;
  }
  return result;
}

// proc(5): ID parent major:minor root MOUNT-POINT options [optional...] - FS-TYPE SOURCE options
bool ParseLine(const std::string& line, std::string& mountPoint, Mount& mount) {
  std::istringstream words(line);
  std::string skipped;
  for (int i = 0; i < 4; ++i) words >> skipped;
  words >> mountPoint;
  while (words >> skipped && skipped != "-") {
  }
  if (!(words >> mount.fsType >> mount.device)) return false;
  mountPoint = Unescape(mountPoint);
  mount.device = Unescape(mount.device);
  return true;
}

unsigned int ToMiB(unsigned long long blocks, unsigned long long blockSize) {
  const unsigned long long mib = blocks / 1024 * blockSize / 1024;
  return static_cast<unsigned int>(
      std::min<unsigned long long>(mib, std::numeric_limits<unsigned int>::max()));
}

SqliteValueList MakeRow(const std::string& mountPoint, const Mount& mount, unsigned int now) {
  struct statvfs sizes = {};
  // A mount that may not be looked at is listed with no size.
  if (statvfs(mountPoint.c_str(), &sizes) != 0) sizes = {};
  SqliteValueList row;
  row.AddValue("mount_point", mountPoint);
  row.AddValue("device", mount.device);
  row.AddValue("fs_type", mount.fsType);
  row.AddValue("size_mib", ToMiB(sizes.f_blocks, sizes.f_frsize));
  row.AddValue("free_mib", ToMiB(sizes.f_bavail, sizes.f_frsize));
  row.AddValue("scanned_at", now);
  return row;
}

}  // namespace

Rows ScanMounts() {
  std::map<std::string, Mount> mounts;
  std::ifstream in("/proc/self/mountinfo");
  for (std::string line; std::getline(in, line);) {
    std::string mountPoint;
    Mount mount;
    if (ParseLine(line, mountPoint, mount)) mounts[mountPoint] = mount;
  }
  Rows rows;
  const auto now = static_cast<unsigned int>(std::time(nullptr));
  for (const auto& [mountPoint, mount] : mounts) rows.push_back(MakeRow(mountPoint, mount, now));
  return rows;
}

}  // namespace drctl
