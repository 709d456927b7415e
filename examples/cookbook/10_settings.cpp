#include <kelodrcore/file.h>

#include <fstream>
#include <iostream>
#include <map>

using namespace KeloDRCore;

template <typename Value>
Value Get(const std::map<std::string, Value>& settings, const std::string& key, Value fallback) {
  const auto found = settings.find(key);
  return found != settings.end() ? found->second : fallback;
}

// Prints the settings of the file, with defaults for what is not in it.
bool Print(const std::string& file) {
  std::map<std::string, std::string> texts;
  std::map<std::string, int> numbers;  // the same lines, their values read as numbers
  const int count = File::Read(file, texts);
  if (count < 0 || File::Read(file, numbers) < 0) return false;  // there, but cannot be read
  std::cout << file << ": " << count << " settings, host "
            << Get<std::string>(texts, "host", "localhost") << ", port "
            << Get(numbers, "port", 5566) << ", retries " << Get(numbers, "retries", 3) << '\n';
  return true;
}

int main() {
  std::ofstream("copy.conf") << "host = nas.example\n"
                                "port=8080\n"
                                "label=only the first word counts\n";
  if (!Print("copy.conf") || !Print("missing.conf")) return 1;
}
