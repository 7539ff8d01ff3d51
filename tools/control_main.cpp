#include <iostream>

#include "client/ClientRuntime.h"
#include "tools/ControlTool.h"

int main(int argc, char** argv) {
  return telvane::ControlTool(telvane::ClientRuntime::current().context(), std::cout, std::cerr).run(argc, argv);
}
