#pragma once

// What the service manager does for a program and wants to hear from it.
namespace telvane::servicemanager {

// Whether the service manager started this process for a client and passed a socket. To be asked before the socket is
// taken, which hides it.
bool wasActivated();
// Tell the service manager that the program serves, and that it is about to end. Nothing happens without one.
void notifyReady();
void notifyStopping();

}  // namespace telvane::servicemanager
