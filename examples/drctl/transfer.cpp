#include "transfer.h"

#include <kelodrcore/err.h>
#include <kelodrcore/file.h>
#include <kelodrcore/json_value.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <set>

#include "output.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

constexpr char kFormat[] = "drctl registry";
constexpr int kVersion = 1;

// What an import expects of one of the two lists.
struct Section {
  const char* member;
  const char* key;
  const std::vector<Column>& columns;
  std::string (*check)(const SqliteValueList& row);
};

std::string CheckWholeNode(const SqliteValueList& node) { return CheckNode(node, true); }

const Section kNodeSection = {"nodes", "name", NodeColumns(), CheckWholeNode};
const Section kVolumeSection = {"volumes", "mount_point", VolumeColumns(), CheckVolume};

std::string ReadEntry(const Json::Value& entry, const Section& section, std::set<std::string>& keys,
                      SqliteValueList& row) {
  std::string complaint = FromJson(entry, section.columns, row);
  if (complaint.empty()) complaint = section.check(row);
  if (!complaint.empty()) return complaint;
  const std::string key = entry[section.key].asString();
  return keys.insert(key).second ? "" : "there is another " + std::string(section.key) + " " + key;
}

// The rows of one list of the document; false when an entry was refused.
bool ReadSection(const Json::Value& document, const Section& section, Rows& rows) {
  const Json::Value& entries = document[section.member];
  if (!entries.isArray()) {
    std::cerr << "drctl: refused: " << section.member << " is not an array\n";
    return false;
  }
  bool isGood = true;
  std::set<std::string> keys;
  for (Json::ArrayIndex i = 0; i < entries.size(); ++i) {
    SqliteValueList row;
    const std::string complaint = ReadEntry(entries[i], section, keys, row);
    if (complaint.empty()) {
      rows.push_back(row);
      continue;
    }
    std::cerr << "drctl: refused: " << section.member << "[" << i << "]: " << complaint << '\n';
    isGood = false;
  }
  return isGood;
}

// Empty when the document is of the right kind.
std::string CheckDocument(const Json::Value& document) {
  if (document.isNull()) return "no such file";
  if (!document.isObject() || document["format"] != kFormat) return "not a registry's export";
  return document["version"] == kVersion ? "" : "unknown version";
}

int Refuse(const std::string& file, const std::string& why) {
  std::cerr << "drctl: cannot import '" << file << "': " << why << '\n';
  return 1;
}

}  // namespace

int Export(Registry& registry, const std::string& file) {
  Rows nodes;
  Rows volumes;
  if (!registry.ListNodes({}, nodes) || !registry.ListVolumes({}, volumes)) {
    return Complain("cannot read the registry", registry.GetErr());
  }
  Json::Value document;
  document["format"] = kFormat;
  document["version"] = kVersion;
  document[kNodeSection.member] = ToJson(nodes, NodeColumns());
  document[kVolumeSection.member] = ToJson(volumes, VolumeColumns());
  if (!JsonValue::toFile(document, file)) {
    std::cerr << "drctl: cannot write '" << file << "': " << std::strerror(errno) << '\n';
    return 1;
  }
  std::cout << nodes.size() << " nodes and " << volumes.size() << " volumes exported\n";
  return 0;
}

int Import(Registry& registry, const std::string& file) {
  Json::Value document;
  if (!File::Read(file, document)) return Refuse(file, "not a JSON document");
  const std::string complaint = CheckDocument(document);
  if (!complaint.empty()) return Refuse(file, complaint);
  Rows nodes;
  Rows volumes;
  const bool nodesAreGood = ReadSection(document, kNodeSection, nodes);
  const bool volumesAreGood = ReadSection(document, kVolumeSection, volumes);
  if (!nodesAreGood || !volumesAreGood) return Refuse(file, "nothing was changed");
  if (!registry.ReplaceAll(nodes, volumes)) return Complain("cannot import", registry.GetErr());
  std::cout << nodes.size() << " nodes and " << volumes.size() << " volumes imported\n";
  return 0;
}

}  // namespace drctl
