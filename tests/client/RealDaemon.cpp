#include "tests/client/RealDaemon.h"

namespace telvane::testing {

RealDaemon::RealDaemon(const std::string& root)
    : _files(Paths{.root = root, .home = root}),
      _entitlements(_files, _log),
      _service(_files, _dispatch, _log, _entitlements) {
  _log.allowErrors();
  _script = std::make_unique<ScriptedDaemon>(_service);
}

RealDaemon::~RealDaemon() { _script->end(); }

}  // namespace telvane::testing
