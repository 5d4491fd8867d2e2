#pragma once
// The system calls behind running under a service manager: the channel on which a daemon tells
// the command that started it how its start-up ended, the descriptor moves around it, and the
// datagrams of the systemd notification protocol.
//
// None of these functions throws except OsOpenStartChannel; failures come back as return values
// with errno set, because their callers run where an exception would change the outcome of a
// start-up that is otherwise fine. Any thread; no state of their own.

// A pipe whose two ends are close-on-exec and numbered 3 or above (a process started with 0, 1
// or 2 closed would otherwise get them, and daemonizing reopens exactly those). The write end is
// non-blocking, so that a starting command that stopped reading never stalls the daemon.
// Throws QNCOsException naming the failing call.
void OsOpenStartChannel(int& arReadFd, int& arWriteFd);

// A close-on-exec copy of aFd numbered 3 or above; -1 when aFd is not open or none is free.
int OsCopyDescriptor(int aFd) noexcept;

// Makes aTarget refer to what aSource refers to (dup2). False when the system refuses.
bool OsReplaceDescriptor(int aSource, int aTarget) noexcept;

// Makes aTarget refer to /dev/null. False when it cannot be opened or moved.
bool OsNullDescriptor(int aTarget) noexcept;

// Closes aFd; a negative aFd is passed by. The result is ignored: closing is never retried.
void OsCloseDescriptor(int aFd) noexcept;

// Sends one datagram of aLength bytes to the AF_UNIX datagram socket named apAddress: a path, or
// "@name" for a name in the abstract namespace. Returns 0, or the error number (ENAMETOOLONG for
// an address that does not fit). Never blocks for long: a full receiver is EAGAIN.
int OsSendDatagram(const char* apAddress, const char* apData, unsigned long aLength) noexcept;

// The calling process's id.
int OsGetPid() noexcept;
