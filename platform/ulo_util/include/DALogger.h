#ifndef DALOGGER_H
#define DALOGGER_H

/// The process-wide logger of the utility library. Its only service to the
/// database library is the tag under which every log line is written.
class DALogger {
public:
    /// The one logger of the process; never null, never destroyed.
    static DALogger* GetInstance();

    /// The tag passed to __dlog_print with every line: "ULO_DB".
    const char* GetLogTag() const;

    DALogger(const DALogger&) = delete;
    DALogger& operator=(const DALogger&) = delete;

private:
    DALogger() = default;
    ~DALogger() = default;
};

#endif  // DALOGGER_H
