// Runs a program as a user would, and tells what it said.

#ifndef KELODRCORE_TESTS_DRCTL_PROGRAM_H_
#define KELODRCORE_TESTS_DRCTL_PROGRAM_H_

#include <string>
#include <vector>

struct Outcome {
  int status = -1;  // the exit status; -1 when it did not exit
  std::string out;
  std::string err;
};

// Runs `arguments` (the program's path first) with `input` on its standard input and `environment`
// ("NAME=VALUE") besides this process's own, and waits for it. Its streams go through files in
// `dir`, which are removed again.
Outcome RunProgram(const std::string& dir, const std::vector<std::string>& arguments,
                   const std::string& input = "", const std::vector<std::string>& environment = {});

#endif  // KELODRCORE_TESTS_DRCTL_PROGRAM_H_
