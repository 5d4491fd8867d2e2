#pragma once
// The logging companion: one call writes one time-stamped line to the process's log.
//
// Levels are single bits; each call passes exactly one level and its tag:
//   1 "-H-" halt, 8 "-E-" error, 16 "-W-" warning, 32 "-N-" notice, 64 "-I-" info, 128 "-T-" trace.
// The log code is the mask of levels that are written (255 = all).
//
// A line reads:
//   2026-11-22 22:51:18.123456 -T- [tid] function (file:line) message
//
// Guarantees:
// - Any thread may log at any time, also while holding a lock of the system, also before
//   CreateLogger and after destroyLogger. Lines from concurrent threads never interleave or tear:
//   each line is formatted apart and copied whole into the shared buffer under its lock.
// - A line longer than kQNLogMaxLine bytes (header and newline included) is cut; it never
//   overflows. A newline inside a message becomes a space, so one call is always one line.
// - Logging never changes errno.
// - Use the QN_LOG_* macros: they test the level before any argument is evaluated, so a call
//   whose level is masked off costs one relaxed load and a branch.
// - Lines are buffered. "-H-", "-E-" and "-W-" lines are in the file before the call returns;
//   other lines within a second (a flusher thread, started by CreateLogger, writes what has
//   gathered every 200 ms). Nothing is lost at exit() (the assertion's exit(1) included): the
//   buffer is written by an atexit handler, and lines logged after it (static destructors) are
//   written through at once. SIGSEGV, SIGBUS, SIGABRT and SIGFPE write out what is buffered
//   before the process dies: CreateLogger installs a handler for each that writes the buffer,
//   restores the default action and re-raises, so the process still dies of that signal. An
//   application that wants its own handler for these signals installs it after CreateLogger.
// - Before CreateLogger, lines are kept in memory (at most 1 MiB; lines beyond are counted and
//   the count is logged at the head of the log); CreateLogger writes at the head of the log those
//   whose level the mask then in force selects. "-H-", "-E-" and "-W-" lines also go to standard
//   error at once, so a failed start-up is visible before the log exists; no other line reaches
//   standard error unless the journal copy is on (below). After destroyLogger only those levels
//   reach standard error.
// - Journal copy: when CreateLogger finds standard error to be systemd's journal (JOURNAL_STREAM
//   names its device and inode) or QN_LOG_STDERR=1 is set, every line written from then until
//   destroyLogger also goes to standard error, one write per line, behind the priority prefix of
//   sd-daemon(3): "<2>" -H-, "<3>" -E-, "<4>" -W-, "<5>" -N-, "<6>" -I-, "<7>" -T-. The log file
//   is written as without it, and the plain copies of urgent lines are not made twice. Lines logged
//   before CreateLogger reach the journal only as those plain copies. The choice is made at each
//   CreateLogger; with the copy off, a line costs no system call and no lock more.
// - Rotation: CreateLogger registers SIGUSR1 through RegisterSignalHandler (logrotate's
//   postrotate sends it). The handler only writes to the dispatcher's pipe; the dispatcher thread
//   then reopens the log at its path under the logger's write lock: every line lands whole in
//   exactly one of the moved and the new file, none is lost. When the path cannot be opened again
//   the logger writes on to the moved file and says so in an "-E-" line. SIGINT, SIGTERM and
//   SIGHUP are left as they are. An application that wants SIGUSR1 for itself registers its own
//   function after CreateLogger.
// - Opening is safe under a shared directory such as /tmp: a symbolic link at the last component
//   of the path is not followed, and only a regular file owned by the effective user is used. A
//   log file CreateLogger creates gets mode 0640 whatever the umask (a daemon runs with umask 0);
//   an existing file keeps its mode.
// - A log path that cannot be opened or is refused is reported on standard error with the reason;
//   the process goes on and the logger stays as it was (still keeping lines in memory, or still
//   writing the log already open).
// - No thread of its own exists before CreateLogger, so a fork before it (daemonizing) loses
//   nothing; the memory of the lines kept so far is inherited by the child. A child forked after
//   CreateLogger drops the parent's unwritten lines (the parent writes them) and appends its own
//   to the same file, each at once: it has no flusher thread, and starts none.

#include <atomic>

class QNCString;

// The longest line written, in bytes, header and newline included.
constexpr unsigned int kQNLogMaxLine = 2048;

enum QNELogLevel : unsigned int {
  QNLL_Halt = 1,
  QNLL_Error = 8,
  QNLL_Warning = 16,
  QNLL_Notice = 32,
  QNLL_Info = 64,
  QNLL_Trace = 128,
};

// The current log code; read through QNIsLogLevelOn.
extern std::atomic<unsigned int> gsQNLogCode;

inline bool QNIsLogLevelOn(unsigned int aLevel) {
  return (gsQNLogCode.load(std::memory_order_relaxed) & aLevel) != 0;
}

// Writes one line when aLevel's bit is set in the log code; writes nothing otherwise.
void PrintLogMessageWithTimeStamp(unsigned int aLevel, const char* apTag, unsigned int aLine,
                                  const char* apFunction, const char* apFile, const char* apFormat, ...)
    __attribute__((format(printf, 6, 7)));

// Opens the log at acrPath for appending (created with mode 0640 if missing; a symbolic link,
// a file of another user and a file that is not regular are refused) and writes the lines kept
// since start-up. Decides the journal copy and registers SIGUSR1 for reopening (see above). A
// second call writes out and closes the first log and opens the new path. Never throws; a path
// that cannot be opened is reported on standard error. Call it from one thread at a time (start-up
// does).
void CreateLogger(const QNCString& acrPath);

// Writes out and closes the log, stops the flusher thread and ends the journal copy. Later lines
// of "-H-", "-E-" and "-W-" go to standard error only (without a prefix). Blocks until the flusher has ended.
void destroyLogger();

// Writes out every buffered line now. Blocks until the bytes are handed to the kernel.
void flushLogger();

void setLogCode(unsigned int aMask);
void getLogCode(unsigned int& arMask);

// The heartbeat time-out, in seconds, stored for the application's watchdog; the logger keeps it
// and does nothing else with it. Starts at 30.
void setHbTimeout(unsigned int aValue);
void getHbTimeout(unsigned int& arValue);

#define QN_LOG(level, tag, ...)                                                            \
  do {                                                                                     \
    if (QNIsLogLevelOn(level))                                                             \
      PrintLogMessageWithTimeStamp(level, tag, __LINE__, __func__, __FILE__, __VA_ARGS__); \
  } while (0)

#define QN_LOG_HALT(...) QN_LOG(QNLL_Halt, "-H-", __VA_ARGS__)
#define QN_LOG_ERROR(...) QN_LOG(QNLL_Error, "-E-", __VA_ARGS__)
#define QN_LOG_WARNING(...) QN_LOG(QNLL_Warning, "-W-", __VA_ARGS__)
#define QN_LOG_NOTICE(...) QN_LOG(QNLL_Notice, "-N-", __VA_ARGS__)
#define QN_LOG_INFO(...) QN_LOG(QNLL_Info, "-I-", __VA_ARGS__)
#define QN_LOG_TRACE(...) QN_LOG(QNLL_Trace, "-T-", __VA_ARGS__)

// The trace lines on entry to and exit from every operation.
#define QN_ENTERED() QN_LOG_TRACE("%s", "Entered")
#define QN_LEFT() QN_LOG_TRACE("%s", "Left")
