#pragma once

namespace telvane {

// Nothing thrown crosses the library's border. What is thrown below it is for lack of memory or threads, and then the
// host goes on without telemetry.

// Runs the call and returns what it returns, or the fallback when it throws.
template <class Result, class Call>
Result guarded(Result fallback, Call&& call) noexcept {
  try {
    return call();
  } catch (...) {
    return fallback;
  }
}

template <class Call>
void guarded(Call&& call) noexcept {
  try {
    call();
  } catch (...) {
  }
}

}  // namespace telvane
