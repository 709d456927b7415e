#include "support.h"

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <vector>

namespace bench {
namespace {

class ScratchDir {
 public:
  ScratchDir() {
    std::string name = std::filesystem::temp_directory_path() / "kelodr_bench_XXXXXX";
    Require(mkdtemp(name.data()) != nullptr, "no directory for the files");
    path = name;
  }
  ~ScratchDir() { std::filesystem::remove_all(path); }

  std::filesystem::path path;
};

std::vector<void (*)()>& Registrations() {
  static std::vector<void (*)()> registrations;
  return registrations;
}

}  // namespace

Benchmarks::Benchmarks(void (*registerAll)()) { Registrations().push_back(registerAll); }

void RegisterAll() {
  for (const auto registerAll : Registrations()) registerAll();
}

benchmark::internal::Benchmark* Register(const std::string& operation, const std::string& work,
                                         const Contestant& contestant,
                                         const std::function<void(benchmark::State&)>& run) {
  const std::string name = operation + "/" + work + "/" + contestant.name;
  return benchmark::RegisterBenchmark(name.c_str(),
                                      [run, bound = contestant.bound](benchmark::State& state) {
                                        run(state);
                                        if (bound > 0)
                                          state.counters["bound"] = bound;  // for the table
                                      });
}

void Require(bool condition, const std::string& what) {
  if (condition) return;
  fprintf(stderr, "kelodrcore_bench: %s\n", what.c_str());
  std::exit(1);
}

std::string ScratchPath(const std::string& name) {
  static const ScratchDir dir;
  return dir.path / name;
}

void WriteWhole(const std::string& path, const std::string& text) {
  std::ofstream(path, std::ios::binary) << text;
}

std::string SizeName(size_t bytes) {
  const char* const units[] = {"B", "KiB", "MiB"};
  size_t unit = 0;
  for (; bytes >= 1024 && unit < 2; ++unit) bytes /= 1024;
  return std::to_string(bytes) + " " + units[unit];
}

std::string NodesDocument(size_t size) {
  std::string text = "[";
  for (int i = 0; text.size() + 150 < size || i == 0; ++i) {
    char node[200];
    snprintf(node, sizeof(node),
             "%s{\"address\":\"10.0.%d.%d\",\"name\":\"node \\\"%d\\\" of the second site\","
             "\"online\":%s,\"usage\":{\"load\":%d.25,\"total\":%d},\"volumes\":[1,2,null]}",
             i == 0 ? "" : ",", i / 250 % 250, i % 250, i, i % 3 != 0 ? "true" : "false", i % 100,
             i * 1024);
    text += node;
  }
  return text + "]";
}

bool ParseWithJsonCpp(const std::string& text, Json::Value& value) {
  static const std::unique_ptr<Json::CharReader> reader = [] {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
  }();
  return reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
}

std::string WriteWithJsonCpp(const Json::Value& value) {
  static const std::unique_ptr<Json::StreamWriter> writer = [] {
    Json::StreamWriterBuilder builder;
    builder["commentStyle"] = "None";
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
  }();
  std::ostringstream buffer;
  writer->write(value, &buffer);
  return buffer.str();
}

std::string WriteFastWithJsonCpp(const Json::Value& value) {
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
  Json::FastWriter writer;
  writer.omitEndingLineFeed();
  return writer.write(value);
#pragma GCC diagnostic pop
}

}  // namespace bench
