#include "commands.h"

#include <kelodrcore/err.h>
#include <kelodrcore/file.h>

#include <iostream>
#include <map>

#include "mounts.h"
#include "output.h"
#include "volume_cache.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

SqliteValueList GivenFields(const Options& options) {
  SqliteValueList fields;
  if (options.address) fields.AddValue("address", *options.address);
  if (options.port) fields.AddValue("port", *options.port);
  if (options.state) fields.AddValue("state", *options.state);
  return fields;
}

// The exit status; a failure is told with the registry's reason.
int Finish(bool isDone, const std::string& what, const Registry& registry, const Options& options) {
  return isDone ? 0 : Complain("cannot " + what, registry.GetErr(), options.json);
}

using Each = bool (Registry::*)(const Query& query, const Take& take);

int PrintList(const Options& options, Each each, const std::vector<Column>& columns,
              const std::string& what) {
  Registry registry(options.db);
  RowPrinter printer(columns, options.json);
  const bool isDone =
      registry.CheckThere() && (registry.*each)(options.query, [&](const SqliteValueList& row) {
        return printer.Print(row);
      });
  if (isDone) printer.End();
  return Finish(isDone, "list the " + what, registry, options);
}

int ListCachedVolumes(const Options& options) {
  VolumeCache cache(options.cacheDir, options.maxAge);
  Json::Value volumes;
  for (int i = 0; i < options.repeat; ++i) {
    Source source = Source::kFile;
    volumes = cache.ReadVolumes(source);
    if (options.verbose) std::cerr << "drctl: answered from " << ToText(source) << '\n';
  }
  RowPrinter printer(VolumeColumns(), options.json);
  for (const Json::Value& volume : volumes) {
    SqliteValueList row;
    // A cache file that somebody edited may hold anything.
    if (FromJson(volume, VolumeColumns(), row).empty()) printer.Print(row);
  }
  printer.End();
  return 0;
}

}  // namespace

int AddNode(const Options& options) {
  Registry registry(options.db);
  SqliteValueList node = GivenFields(options);
  node.AddValue("name", options.name);
  if (!options.state) node.AddValue("state", "unknown");
  const bool isDone = registry.AddNode(node);
  return Finish(isDone, "add node '" + options.name + "'", registry, options);
}

int SetNode(const Options& options) {
  Registry registry(options.db);
  const bool isDone = registry.SetNode(options.name, GivenFields(options));
  return Finish(isDone, "change node '" + options.name + "'", registry, options);
}

int RemoveNode(const Options& options) {
  Registry registry(options.db);
  const bool isDone = registry.RemoveNode(options.name);
  return Finish(isDone, "remove node '" + options.name + "'", registry, options);
}

int ListNodes(const Options& options) {
  return PrintList(options, &Registry::EachNode, NodeColumns(), "nodes");
}

int CountNodes(const Options& options) {
  Registry registry(options.db);
  int count = 0;
  const bool isDone = registry.CheckThere() && registry.CountNodes(count);
  if (isDone) std::cout << count << '\n';
  return Finish(isDone, "count the nodes", registry, options);
}

int ScanVolumes(const Options& options) {
  Registry registry(options.db);
  const Rows volumes = ScanMounts();
  const bool isDone = volumes.empty()
                          ? registry.Fail(ERR::ERR_UNKNOWN, "/proc/self/mountinfo cannot be read")
                          : registry.ReplaceVolumes(volumes);
  if (isDone) {
    Json::Value counts;
    counts["volumes"] = Json::UInt64{volumes.size()};
    PrintDone(std::to_string(volumes.size()) + " mount points stored", counts, options.json);
  }
  return Finish(isDone, "store the volumes", registry, options);
}

int ListVolumes(const Options& options) {
  if (options.cached) return ListCachedVolumes(options);
  return PrintList(options, &Registry::EachVolume, VolumeColumns(), "volumes");
}

int ShowSystem(const Options& options) {
  std::map<std::string, std::string> settings;
  if (File::Read(options.file, settings) <= 0) {
    return Complain("cannot show the system",
                    MakeErr(ERR::ERR_UNKNOWN, "there is no setting in '" + options.file + "'"),
                    options.json);
  }
  Json::Value object(Json::objectValue);
  for (const auto& [key, value] : settings) {
    object[key] = value;
    if (!options.json) std::cout << key << '=' << value << '\n';
  }
  if (options.json) PrintJson(object);
  return 0;
}

}  // namespace drctl
