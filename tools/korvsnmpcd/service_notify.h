// Tells the service manager that the daemon is ready (systemd's Type=notify),
// without linking libsystemd.
#ifndef KORVSNMPCD_SERVICE_NOTIFY_H
#define KORVSNMPCD_SERVICE_NOTIFY_H

namespace korvsnmpcd {

// Sends "READY=1" to the datagram socket named by $NOTIFY_SOCKET (a path, or
// an abstract name after '@'), then removes the variable so that no child
// inherits it. Does nothing without the variable; logs a failure to send.
void NotifyReady();

}  // namespace korvsnmpcd

#endif
