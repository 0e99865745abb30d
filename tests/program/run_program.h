// Runs a program to its end and catches what it says.
#ifndef QUORLET_TESTS_PROGRAM_RUN_PROGRAM_H_
#define QUORLET_TESTS_PROGRAM_RUN_PROGRAM_H_

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace quorlet {

struct ProgramResult {
  int status = -1;  // the exit status; minus the signal's number when one ended the program
  std::string out;
  std::string err;
};

struct ProgramSetting {
  std::map<std::string, std::string> environment;  // besides what the test has
  std::string input;                               // standard input
  const char* outputFile = nullptr;                // standard output, instead of catching it
};

inline std::string ReadFromStart(std::FILE* file) {
  std::string bytes;
  char block[4096];
  std::rewind(file);
  while (const std::size_t size = std::fread(block, 1, sizeof block, file)) {
    bytes.append(block, size);
  }
  return bytes;
}

inline ProgramResult RunProgram(const char* program, std::vector<std::string> arguments,
                                const ProgramSetting& setting) {
  // Files, not pipes: whatever the amount, neither side waits for the other.
  std::FILE* files[3] = {std::tmpfile(), std::tmpfile(), std::tmpfile()};
  for (std::FILE* file : files) {
    if (file == nullptr) std::abort();
  }
  std::fwrite(setting.input.data(), 1, setting.input.size(), files[0]);
  std::fflush(files[0]);
  std::rewind(files[0]);

  std::string name = program;
  std::vector<char*> words = {name.data()};
  for (std::string& argument : arguments) words.push_back(argument.data());
  words.push_back(nullptr);
  const pid_t child = fork();
  if (child == 0) {
    for (int stream = 0; stream < 3; ++stream) dup2(fileno(files[stream]), stream);
    if (setting.outputFile != nullptr) dup2(open(setting.outputFile, O_WRONLY), STDOUT_FILENO);
    for (const auto& [variable, value] : setting.environment) {
      setenv(variable.c_str(), value.c_str(), 1);
    }
    execv(program, words.data());
    _exit(127);
  }
  int status = 0;
  waitpid(child, &status, 0);
  ProgramResult result{WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status),
                       ReadFromStart(files[1]), ReadFromStart(files[2])};
  for (std::FILE* file : files) std::fclose(file);
  return result;
}

}  // namespace quorlet

#endif  // QUORLET_TESTS_PROGRAM_RUN_PROGRAM_H_
