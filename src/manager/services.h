// The services that hold files open on disks, and the firewall rule that lets WebDAV in.
#pragma once

// Stop and start the four file services, each command waited for before the next. What came of a
// command is not looked at: a service that is not installed must not keep a disk from leaving.
void services_stop();
void services_start();

// Opens the WebDAV rule of the firewall once a disk is present, unless the user has set the port
// options; at most once per process and looked at every 10 s at most. Nothing in the daemon calls
// it. 0, or 1 when no configuration context could be made.
int firewall_webdav_check();

// Forgets what that rule has seen in the life of the process. For tests.
void firewall_rule_reset();
