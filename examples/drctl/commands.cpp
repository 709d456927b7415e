#include "commands.h"

#include <kelodrcore/file.h>

#include <iostream>
#include <map>

#include "mounts.h"
#include "output.h"
#include "transfer.h"
#include "volume_cache.h"

namespace drctl {

using KeloDRCore::SqliteValueList;

namespace {

SqliteValueList GivenFields(const Options& options) {
  SqliteValueList fields;
  if (options.address) fields.AddValue("address", *options.address);
  if (options.port) fields.AddValue("port", *options.port);
  if (options.state) fields.AddValue("state", *options.state);
  return fields;
}

int ListCachedVolumes(const Options& options) {
  VolumeCache cache(options.cacheDir, options.maxAge);
  Json::Value volumes;
  for (int i = 0; i < options.repeat; ++i) {
    Source source = Source::kFile;
    volumes = cache.ReadVolumes(source);
    if (options.verbose) std::cerr << "drctl: answered from " << ToText(source) << '\n';
  }
  Rows rows;
  for (const Json::Value& volume : volumes) {
    SqliteValueList row;
    // A cache file that somebody edited may hold anything.
    if (FromJson(volume, VolumeColumns(), row).empty()) rows.push_back(row);
  }
  Print(rows, VolumeColumns(), options.json);
  return 0;
}

}  // namespace

int AddNode(const Options& options) {
  Registry registry(options.db);
  SqliteValueList node = GivenFields(options);
  node.AddValue("name", options.name);
  if (!options.state) node.AddValue("state", "unknown");
  if (registry.AddNode(node)) return 0;
  return Complain("cannot add node '" + options.name + "'", registry.GetErr());
}

int SetNode(const Options& options) {
  Registry registry(options.db);
  if (registry.SetNode(options.name, GivenFields(options))) return 0;
  return Complain("cannot change node '" + options.name + "'", registry.GetErr());
}

int RemoveNode(const Options& options) {
  Registry registry(options.db);
  if (registry.RemoveNode(options.name)) return 0;
  return Complain("cannot remove node '" + options.name + "'", registry.GetErr());
}

int ListNodes(const Options& options) {
  Registry registry(options.db);
  Rows rows;
  if (!registry.ListNodes(options.query, rows)) {
    return Complain("cannot list the nodes", registry.GetErr());
  }
  Print(rows, NodeColumns(), options.json);
  return 0;
}

int CountNodes(const Options& options) {
  Registry registry(options.db);
  int count = 0;
  if (!registry.CountNodes(count)) return Complain("cannot count the nodes", registry.GetErr());
  std::cout << count << '\n';
  return 0;
}

int ScanVolumes(const Options& options) {
  Registry registry(options.db);
  const Rows volumes = ScanMounts();
  if (volumes.empty()) {
    std::cerr << "drctl: cannot read the mounts from /proc/self/mountinfo\n";
    return 1;
  }
  if (!registry.ReplaceVolumes(volumes)) {
    return Complain("cannot store the volumes", registry.GetErr());
  }
  std::cout << volumes.size() << " mount points stored\n";
  return 0;
}

int ListVolumes(const Options& options) {
  if (options.cached) return ListCachedVolumes(options);
  Registry registry(options.db);
  Rows rows;
  if (!registry.ListVolumes(options.query, rows)) {
    return Complain("cannot list the volumes", registry.GetErr());
  }
  Print(rows, VolumeColumns(), options.json);
  return 0;
}

int ShowSystem(const Options& options) {
  std::map<std::string, std::string> settings;
  if (KeloDRCore::File::Read(options.file, settings) <= 0) {
    std::cerr << "drctl: cannot read any setting from '" << options.file << "'\n";
    return 1;
  }
  Json::Value object(Json::objectValue);
  for (const auto& [key, value] : settings) {
    object[key] = value;
    if (!options.json) std::cout << key << '=' << value << '\n';
  }
  if (options.json) PrintJson(object);
  return 0;
}

int ExportRegistry(const Options& options) {
  Registry registry(options.db);
  return Export(registry, options.file);
}

int ImportRegistry(const Options& options) {
  Registry registry(options.db);
  return Import(registry, options.file);
}

}  // namespace drctl
