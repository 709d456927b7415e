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

// The exit status; a failure is told with the registry's reason.
int Finish(bool isDone, const std::string& what, const Registry& registry) {
  return isDone ? 0 : Complain("cannot " + what, registry.GetErr());
}

using List = bool (Registry::*)(const Query& query, Rows& rows);

int PrintList(const Options& options, List list, const std::vector<Column>& columns,
              const std::string& what) {
  Registry registry(options.db);
  Rows rows;
  const bool isDone = (registry.*list)(options.query, rows);
  if (isDone) Print(rows, columns, options.json);
  return Finish(isDone, "list the " + what, registry);
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
  return Finish(registry.AddNode(node), "add node '" + options.name + "'", registry);
}

int SetNode(const Options& options) {
  Registry registry(options.db);
  const bool isDone = registry.SetNode(options.name, GivenFields(options));
  return Finish(isDone, "change node '" + options.name + "'", registry);
}

int RemoveNode(const Options& options) {
  Registry registry(options.db);
  const bool isDone = registry.RemoveNode(options.name);
  return Finish(isDone, "remove node '" + options.name + "'", registry);
}

int ListNodes(const Options& options) {
  return PrintList(options, &Registry::ListNodes, NodeColumns(), "nodes");
}

int CountNodes(const Options& options) {
  Registry registry(options.db);
  int count = 0;
  const bool isDone = registry.CountNodes(count);
  if (isDone) std::cout << count << '\n';
  return Finish(isDone, "count the nodes", registry);
}

int ScanVolumes(const Options& options) {
  Registry registry(options.db);
  const Rows volumes = ScanMounts();
  if (volumes.empty()) {
    std::cerr << "drctl: cannot read the mounts from /proc/self/mountinfo\n";
    return 1;
  }
  const bool isDone = registry.ReplaceVolumes(volumes);
  if (isDone) std::cout << volumes.size() << " mount points stored\n";
  return Finish(isDone, "store the volumes", registry);
}

int ListVolumes(const Options& options) {
  if (options.cached) return ListCachedVolumes(options);
  return PrintList(options, &Registry::ListVolumes, VolumeColumns(), "volumes");
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
