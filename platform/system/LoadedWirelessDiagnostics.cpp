#include "platform/system/LoadedWirelessDiagnostics.h"

#include <cxxabi.h>
#include <dlfcn.h>

#include <exception>
#include <filesystem>
#include <functional>
#include <optional>
#include <vector>

#include "platform/PropertyList.h"
#include "platform/include/telvane/VDRAdaptor.h"
#include "platform/system/PropertyListNode.h"

namespace telvane {
namespace {

namespace fs = std::filesystem;

// The functions of one shared object, which stay where they are.
struct AdaptorFunctions {
  decltype(&TelvaneVDRAdaptorGetVersion) getVersion = nullptr;
  decltype(&TelvaneVDRAdaptorCreate) create = nullptr;
  decltype(&TelvaneVDRAdaptorRespondsToSelector) respondsToSelector = nullptr;
  decltype(&TelvaneVDRAdaptorSendMessage) sendMessage = nullptr;
  decltype(&TelvaneVDRAdaptorRelease) release = nullptr;
};

// Calls into a shared object by its author, and lets nothing that it throws get out: a line in the log says what. A
// function that ends its thread cannot be held: the runtime unwinds the thread's stack like an exception, and ends the
// process at once when somebody catches that and goes on. So it passes, and the log's last line says who was to blame.
class ForeignCode {
 public:
  ForeignCode(std::string path, Log& log) : _path(std::move(path)), _log(log) {}

  const std::string& path() const noexcept { return _path; }
  Log& log() const noexcept { return _log; }
  // Returns whether the call came back. function: its name.
  // What ends a thread is no C++ exception and has no object, so its reference is bound to nothing, and never looked
  // at.
  __attribute__((no_sanitize("undefined"))) bool call(std::string_view function,
                                                      const std::function<void()>& call) const {
    try {
      call();
      return true;
    } catch (const abi::__forced_unwind&) {
      _log.error("{} of {} ended the thread that called it", function, _path);
      _log.flush();
      throw;
    } catch (const std::exception& thrown) {
      _log.error("{} of {} threw an exception: {}", function, _path, thrown.what());
    } catch (...) {
      _log.error("{} of {} threw an exception of a kind of its own", function, _path);
    }
    return false;
  }

 private:
  const std::string _path;
  Log& _log;
};

class LoadedAdaptor final : public WirelessDiagnosticsAdaptor {
 public:
  LoadedAdaptor(const ForeignCode& code, const AdaptorFunctions& functions, std::string className,
                TelvaneVDRAdaptorRef instance)
      : _code(code), _functions(functions), _className(std::move(className)), _instance(instance) {}
  ~LoadedAdaptor() override {
    _code.call("TelvaneVDRAdaptorRelease", [this] { _functions.release(_instance); });
  }

  std::string description() const override { return fmt::format("<{} of {}>", _className, _code.path()); }

  bool respondsTo(std::string_view selector) const override {
    const std::string text(selector);
    bool responds = false;
    _code.call("TelvaneVDRAdaptorRespondsToSelector",
               [&] { responds = _functions.respondsToSelector(_instance, text.c_str()); });
    return responds;
  }

  void sendMessageWithMethod(uint16_t method, uint16_t respCode, const Dictionary& dict) override {
    // Making the node is part of the call: for lack of memory the event is lost, and nothing else.
    _code.call("TelvaneVDRAdaptorSendMessage", [&] {
      const propertylist::OwnedNode node(propertylist::newNode(dict));
      _functions.sendMessage(_instance, method, respCode, node.get());
    });
  }

 private:
  const ForeignCode _code;
  const AdaptorFunctions _functions;
  const std::string _className;
  const TelvaneVDRAdaptorRef _instance;
};

class LoadedBundle final : public WirelessDiagnosticsBundle {
 public:
  LoadedBundle(ForeignCode code, const AdaptorFunctions& functions) : _code(std::move(code)), _functions(functions) {}

  std::unique_ptr<WirelessDiagnosticsAdaptor> newInstanceOfClass(std::string_view className) override {
    std::string name(className);
    TelvaneVDRAdaptorRef instance = nullptr;
    if (!_code.call("TelvaneVDRAdaptorCreate", [&] { instance = _functions.create(name.c_str()); })) return nullptr;
    if (instance == nullptr) {
      _code.log().error("newInstanceOfClass: {} has no class {}", _code.path(), name);
      return nullptr;
    }
    return std::make_unique<LoadedAdaptor>(_code, _functions, std::move(name), instance);
  }

 private:
  const ForeignCode _code;
  const AdaptorFunctions _functions;
};

// Looks functions up and remembers the names of those that are not there.
class SymbolSearch {
 public:
  explicit SymbolSearch(void* object) : _object(object) {}

  template <class Function>
  void find(const char* name, Function& function) {
    function = reinterpret_cast<Function>(::dlsym(_object, name));
    if (function == nullptr) _missing.emplace_back(name);
  }
  const std::vector<std::string>& missing() const noexcept { return _missing; }

 private:
  void* const _object;
  std::vector<std::string> _missing;
};

std::optional<AdaptorFunctions> functionsOf(void* object, const ForeignCode& code) {
  AdaptorFunctions functions;
  SymbolSearch search(object);
  search.find("TelvaneVDRAdaptorGetVersion", functions.getVersion);
  search.find("TelvaneVDRAdaptorCreate", functions.create);
  search.find("TelvaneVDRAdaptorRespondsToSelector", functions.respondsToSelector);
  search.find("TelvaneVDRAdaptorSendMessage", functions.sendMessage);
  search.find("TelvaneVDRAdaptorRelease", functions.release);
  if (search.missing().empty()) return functions;
  code.log().error("openBundleAtPath: {} is no adaptor, it does not export {}", code.path(),
                   fmt::join(search.missing(), ", "));
  return std::nullopt;
}

bool hasOurVersion(const AdaptorFunctions& functions, const ForeignCode& code) {
  uint32_t version = 0;
  if (!code.call("TelvaneVDRAdaptorGetVersion", [&] { version = functions.getVersion(); })) return false;
  if (version == TELVANE_VDR_ADAPTOR_VERSION) return true;
  code.log().error("openBundleAtPath: {} is an adaptor of version {}, and only version {} can be called", code.path(),
                   version, TELVANE_VDR_ADAPTOR_VERSION);
  return false;
}

}  // namespace

std::unique_ptr<WirelessDiagnosticsBundle> LoadedWirelessDiagnostics::openBundleAtPath(const std::string& path) {
  const fs::path folder = _paths.belowRoot(path);
  std::error_code failure;
  if (!fs::is_directory(folder, failure)) {
    _log.message("openBundleAtPath: There is no bundle {}", folder.string());
    return nullptr;
  }
  const fs::path file = folder / folder.stem();
  // A pipe in its place would be waited for.
  if (!fs::is_regular_file(file, failure)) {
    _log.error("openBundleAtPath: The bundle has no shared object {}", file.string());
    return nullptr;
  }
  void* const object = ::dlopen(file.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
  if (object == nullptr) {
    const char* const reason = ::dlerror();
    _log.error("openBundleAtPath: {} cannot be loaded: {}", file.string(), reason != nullptr ? reason : "no reason");
    return nullptr;
  }
  ForeignCode code(file.string(), _log);
  const std::optional<AdaptorFunctions> functions = functionsOf(object, code);
  // The code stays; this gives back one of the looks at it.
  ::dlclose(object);
  if (!functions.has_value() || !hasOurVersion(*functions, code)) return nullptr;
  return std::make_unique<LoadedBundle>(std::move(code), *functions);
}

}  // namespace telvane
