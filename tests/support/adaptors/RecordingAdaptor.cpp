// An adaptor with the one class VDRAdaptor. Beside its own file it keeps what happens to it: a line for each instance
// in "life", and each message in a file of its own, "message-1.plist" and so on.
#include <dlfcn.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>

#include "platform/include/telvane/VDRAdaptor.h"

#ifndef ADAPTOR_VERSION
#define ADAPTOR_VERSION TELVANE_VDR_ADAPTOR_VERSION
#endif

namespace {

namespace fs = std::filesystem;

struct Instance {
  int number;
};

std::atomic<int> lastInstance{0};
std::atomic<int> lastMessage{0};

fs::path ownFolder() {
  Dl_info info{};
  return ::dladdr(&lastInstance, &info) != 0 ? fs::path(info.dli_fname).parent_path() : fs::path();
}

void note(const std::string& line) { std::ofstream(ownFolder() / "life", std::ios::app) << line << "\n"; }

Instance* instanceOf(TelvaneVDRAdaptorRef adaptor) { return reinterpret_cast<Instance*>(adaptor); }

}  // namespace

uint32_t TelvaneVDRAdaptorGetVersion(void) { return ADAPTOR_VERSION; }

TelvaneVDRAdaptorRef TelvaneVDRAdaptorCreate(const char* className) {
  if (std::strcmp(className, "VDRAdaptor") != 0) return nullptr;
  auto* const instance = new Instance{++lastInstance};
  note("create " + std::to_string(instance->number));
  return reinterpret_cast<TelvaneVDRAdaptorRef>(instance);
}

bool TelvaneVDRAdaptorRespondsToSelector(TelvaneVDRAdaptorRef, const char* selector) {
  return std::strcmp(selector, "sendMessageWithMethod:respCode:dict:") == 0;
}

// The file is there when it is whole.
void TelvaneVDRAdaptorSendMessage(TelvaneVDRAdaptorRef adaptor, uint16_t method, uint16_t respCode, plist_t dict) {
  plist_t const message = plist_new_dict();
  plist_dict_set_item(message, "instance", plist_new_uint(static_cast<uint64_t>(instanceOf(adaptor)->number)));
  plist_dict_set_item(message, "method", plist_new_uint(method));
  plist_dict_set_item(message, "respCode", plist_new_uint(respCode));
  plist_dict_set_item(message, "dict", plist_copy(dict));
  char* bytes = nullptr;
  uint32_t length = 0;
  plist_to_bin(message, &bytes, &length);
  plist_free(message);
  const fs::path folder = ownFolder();
  const std::string name = "message-" + std::to_string(++lastMessage);
  std::ofstream(folder / name, std::ios::binary).write(bytes, length);
  std::free(bytes);
  fs::rename(folder / name, folder / (name + ".plist"));
}

void TelvaneVDRAdaptorRelease(TelvaneVDRAdaptorRef adaptor) {
  note("release " + std::to_string(instanceOf(adaptor)->number));
  delete instanceOf(adaptor);
}
