// vv: the front end for a person at a terminal. It finds what is meant, runs the tool, shows how it gets on,
// and explains what went wrong.
#include "begin.h"
#include "common/memory.h"
#include "vv/command_line.h"
#include "vv/options.h"
#include "vvstat/columns.h"

int main(int argc, char** argv) {
  remvol::begin();
  platform::end_when_memory_is_short(vv::kFailed);
  vvstat::use_utf8();
  vv::Options options;
  const int status = vv::read_options(argc, argv, options);
  return status >= 0 ? status : options.command->run(options);
}
