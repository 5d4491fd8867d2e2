#pragma once
// Byte streams over file descriptors (sockets, pipes): the system calls behind the
// descriptor-based channel ends. EINTR is retried everywhere; no call raises SIGPIPE.

// Puts the descriptor into non-blocking mode. Throws QNCOsException naming the descriptor.
void OsSetNonBlocking(int aFd);

// One read(2) of at most aCount bytes. Returns the number read (0 at the end of the stream), or
// -1 when nothing can be read now (EAGAIN). Throws QNCReadFailedEx for every other failure.
long OsReadSome(int aFd, void* apBuffer, unsigned long aCount);

// True when the descriptor is a socket (asked once per descriptor by its owner, not per write).
bool OsIsSocket(int aFd);

// Writes all aCount bytes, looping over partial writes. When the descriptor is non-blocking and
// full, waits for it to drain, at most aTimeoutMs milliseconds in all (0: no limit). A peer that
// has gone is QNCWriteFailedEx ("... Broken pipe"), never a SIGPIPE; a time-out is QNCTimeOutEx.
// aIsSocket: what OsIsSocket said of aFd.
void OsWriteAll(int aFd, bool aIsSocket, const void* apBuffer, unsigned long aCount, unsigned int aTimeoutMs);

// Waits until the descriptor is readable, at the end of its stream, or in error (true), or
// aTimeoutMs milliseconds have passed (false).
bool OsWaitReadable(int aFd, unsigned int aTimeoutMs);

// Sets TCP_NODELAY when the descriptor is a TCP socket; does nothing for other descriptors.
void OsDisableNagleIfTcp(int aFd);
