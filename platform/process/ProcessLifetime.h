#pragma once

// What happens to this process as a whole: it forks, it ends. For libraries, which do not own the process they are in.
namespace telvane {

// Has the handler called in every child that this process forks, on the child's only thread, before fork returns
// there. The handler may only touch atomics: locks may be held by threads that the child does not have. Handlers
// cannot be taken back.
void callInForkedChild(void (*handler)());

// Has the handler called once when this process ends by exit or by returning from main, not when it is killed or ends
// by _exit. Handlers run before the destructors of objects that were made before this call.
void callAtExit(void (*handler)());

}  // namespace telvane
