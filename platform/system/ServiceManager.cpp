#include "platform/system/ServiceManager.h"

#include <systemd/sd-daemon.h>

namespace telvane::servicemanager {

bool wasActivated() { return sd_listen_fds(0) > 0; }

void notifyReady() { sd_notify(0, "READY=1"); }

void notifyStopping() { sd_notify(0, "STOPPING=1"); }

}  // namespace telvane::servicemanager
