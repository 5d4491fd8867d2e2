#pragma once
// Byte streams over file descriptors (sockets, pipes): the system calls behind the
// descriptor-based channel ends and every loop that writes a whole buffer. EINTR is retried
// everywhere; no call raises SIGPIPE unless told to (QNPS_Raise). Failures name the descriptor,
// with its path when the system still knows it (OsError.h).

// Creates a pipe whose two ends close on exec and whose write end does not block: a writer that
// finds it full (a signal handler, a daemon whose starting command stopped reading) loses those
// bytes instead of stalling. Throws QNCOsException naming the failing call.
void OsOpenWakePipe(int& arReadFd, int& arWriteFd);

// Puts the descriptor into non-blocking mode. Throws QNCOsException.
void OsSetNonBlocking(int aFd);

// One read(2) of at most aCount bytes. Returns the number read (0 at the end of the stream), or
// -1 when nothing can be read now (EAGAIN). Throws QNCReadFailedEx for every other failure.
long OsReadSome(int aFd, void* apBuffer, unsigned long aCount);

// True when the descriptor is a socket (asked once per descriptor by its owner, not per write).
bool OsIsSocket(int aFd);

// How a write treats SIGPIPE, which write(2) raises when the reading end has gone.
enum QNEPipeSignal : unsigned char {
  QNPS_Raise = 0,    // plain write(2): SIGPIPE is raised (EPIPE where it is ignored)
  QNPS_Socket = 1,   // send(2) with MSG_NOSIGNAL: EPIPE only; aFd must be a socket (OsIsSocket)
  QNPS_Blocked = 2,  // write(2) with SIGPIPE blocked in this thread and the one it raised taken
                     // back: EPIPE only, for pipes; costs four more system calls per write
};

// The one loop that writes a whole buffer. Continues after partial writes and after EINTR (a
// signal before any byte went out) until all aCount bytes are written, and returns 0. Otherwise
// returns the error number of the write that failed -- EIO for a write that took no byte -- with
// the bytes written before it (arWritten) left written. EAGAIN (a non-blocking descriptor that is
// full) is returned at once, nothing waits here: whether to wait and how long is the caller's
// choice (OsWriteAll waits for the peer to drain, ClibWrite fails). Throws nothing and allocates
// nothing; with QNPS_Raise it makes write(2) calls only and is async-signal-safe.
int OsWriteFully(int aFd, const void* apBuffer, unsigned long aCount, QNEPipeSignal aPipeSignal,
                 unsigned long& arWritten) noexcept;

// Writes all aCount bytes with OsWriteFully. When the descriptor is non-blocking and full, waits
// for it to drain, at most aTimeoutMs milliseconds in all (0: no limit). A peer that has gone is
// QNCWriteFailedEx ("... Broken pipe"), never a SIGPIPE; a time-out is QNCTimeOutEx.
// aIsSocket: what OsIsSocket said of aFd.
void OsWriteAll(int aFd, bool aIsSocket, const void* apBuffer, unsigned long aCount, unsigned int aTimeoutMs);

// Waits until the descriptor is readable, at the end of its stream, or in error (true), or
// aTimeoutMs milliseconds have passed (false).
bool OsWaitReadable(int aFd, unsigned int aTimeoutMs);

// Sets TCP_NODELAY when the descriptor is a TCP socket; does nothing for other descriptors.
void OsDisableNagleIfTcp(int aFd);
