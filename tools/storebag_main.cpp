#include <iostream>

#include "platform/system/PosixFileSystem.h"
#include "tools/StorebagTool.h"

int main(int argc, char** argv) {
  telvane::PosixFileSystem files(telvane::Paths{});
  return telvane::StorebagTool(files, std::cout, std::cerr).run(argc, argv);
}
