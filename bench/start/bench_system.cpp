// Runs the lines of a file as shell commands, one after the other, as the tool runs its own: by system(3).
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

int main(int argc, char** argv) {
  if (argc != 2) {
    fputs("usage: bench_system FILE\n", stderr);
    return 2;
  }
  std::ifstream commands(argv[1]);
  int result = 0;
  for (std::string line; result >= 0 && std::getline(commands, line);) result = system(line.c_str());
  return result < 0 ? 2 : 0;
}
