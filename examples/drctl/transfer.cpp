#include "transfer.h"

#include <kelodrcore/err.h>
#include <kelodrcore/file.h>
#include <kelodrcore/json_value.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <iterator>
#include <set>

#include "output.h"
#include "progress.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

constexpr char kFormat[] = "drctl registry";
constexpr int kVersion = 1;
constexpr char kStream[] = "-";

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

// The rows of one list of the document; what is wrong with its entries is added to `refused`.
Rows ReadSection(const Json::Value& document, const Section& section, Json::Value& refused) {
  Rows rows;
  const Json::Value& entries = document[section.member];
  if (!entries.isArray()) {
    refused.append(std::string(section.member) + " is not an array");
    return rows;
  }
  std::set<std::string> keys;
  for (Json::ArrayIndex i = 0; i < entries.size(); ++i) {
    SqliteValueList row;
    const std::string complaint = ReadEntry(entries[i], section, keys, row);
    if (complaint.empty()) {
      rows.push_back(row);
    } else {
      refused.append(std::string(section.member) + "[" + std::to_string(i) + "]: " + complaint);
    }
  }
  return rows;
}

bool ReadDocument(const std::string& file, Json::Value& document) {
  if (file != kStream) return File::Read(file, document);
  const std::string text{std::istreambuf_iterator<char>(std::cin), {}};
  return JsonValue::fromString(document, text);
}

// Empty when the document is of the right kind.
std::string CheckDocument(const Json::Value& document) {
  if (document.isNull()) return "there is no such file";
  if (!document.isObject() || document["format"] != kFormat) return "it is not a registry's export";
  return document["version"] == kVersion ? "" : "its version is unknown";
}

// What is wrong with single entries is said line by line, or all in one document.
int RefuseEntries(const std::string& what, const Json::Value& refused, bool asJson) {
  if (asJson) return Complain(what, MakeErr(ERR::BAD_PARAMETER, refused), asJson);
  for (const Json::Value& entry : refused) {
    std::cerr << "drctl: refused: " << Printable(entry.asString()) << '\n';
  }
  return Complain(what, MakeErr(ERR::BAD_PARAMETER, "nothing was changed"), asJson);
}

bool Store(Registry& registry, const Rows& nodes, const Rows& volumes) {
  Progress progress(nodes.size() + volumes.size());
  return registry.ReplaceAll(nodes, volumes, [&](size_t rows) { progress.Add(rows); });
}

int TellDone(size_t nodes, size_t volumes, const std::string& done, bool asJson) {
  Json::Value counts;
  counts[kNodeSection.member] = Json::UInt64{nodes};
  counts[kVolumeSection.member] = Json::UInt64{volumes};
  PrintDone(std::to_string(nodes) + " nodes and " + std::to_string(volumes) + " volumes " + done,
            counts, asJson);
  return 0;
}

}  // namespace

int ExportRegistry(const Options& options) {
  Registry registry(options.db);
  Json::Value document;
  document["format"] = kFormat;
  document["version"] = kVersion;
  Json::Value& nodes = document[kNodeSection.member];
  Json::Value& volumes = document[kVolumeSection.member];
  if (!registry.CheckThere() || !registry.ReadNodes({}, nodes) ||
      !registry.ReadVolumes({}, volumes)) {
    return Complain("cannot export", registry.GetErr(), options.json);
  }
  if (options.file == kStream) {
    PrintJson(document);
    return 0;
  }
  if (!JsonValue::toFile(document, options.file)) {
    return Complain("cannot write '" + options.file + "'",
                    MakeErr(ERR::ERR_UNKNOWN, std::strerror(errno)), options.json);
  }
  return TellDone(nodes.size(), volumes.size(), "exported", options.json);
}

int ImportRegistry(const Options& options) {
  const std::string what = "cannot import '" + options.file + "'";
  Json::Value document;
  std::string complaint = "it is not a JSON document";
  if (ReadDocument(options.file, document)) complaint = CheckDocument(document);
  if (!complaint.empty()) {
    return Complain(what, MakeErr(ERR::BAD_PARAMETER, complaint), options.json);
  }
  Json::Value refused(Json::arrayValue);
  const Rows nodes = ReadSection(document, kNodeSection, refused);
  const Rows volumes = ReadSection(document, kVolumeSection, refused);
  if (!refused.empty()) return RefuseEntries(what, refused, options.json);
  Registry registry(options.db);
  if (!Store(registry, nodes, volumes)) {
    return Complain(what, registry.GetErr(), options.json);
  }
  return TellDone(nodes.size(), volumes.size(), "imported", options.json);
}

}  // namespace drctl
