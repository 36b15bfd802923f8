// The bytes of orvpatch.log, cut into header blocks and messages as they come.
//
// Memory does not grow with the log: what goes beyond LongestMessage is counted and dropped. Anything that is
// neither header nor message belongs to the message before it, for a message may have several lines; what a
// patch's command has printed stands in such lines, and nothing in the log tells them from lines of the log.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

enum class LogLevel { Error, Info, Trace };

struct LogHeader {
  std::uint64_t offset = 0; ///< of its first byte
  std::string host;
  std::string user;
  long pid = 0;
};

struct LogMessage {
  LogLevel level = LogLevel::Trace;
  int time = -1; ///< second of the day, local; -1 when the system could not tell it
  std::string component;
  long line = 0; ///< in the source
  std::string text;
  std::size_t omitted = 0; ///< bytes at its end that are not in `text`
};

/// Gets what the reader finds, in the order of the log.
class LogListener {
public:
  LogListener() = default;
  LogListener(const LogListener &) = delete;
  LogListener &operator=(const LogListener &) = delete;
  virtual ~LogListener() = default;

  virtual void onHeader(const LogHeader &header) = 0;
  virtual void onMessage(const LogMessage &message) = 0;
  /// A line to which there is no message: the start of the log is lost.
  virtual void onStray() = 0;
};

class LogReader {
public:
  static constexpr std::size_t LongestMessage = 64UL * 1024;

  /// `offset` is where in the log the first byte stands.
  explicit LogReader(LogListener &listener, std::uint64_t offset = 0);

  void feed(std::string_view bytes);
  /// Nothing more is there for now: hands out the last message, of which all has been read.
  void settle();
  /// Nothing more will come: hands out what is left, a cut line too.
  void finish();

private:
  void takeLine();
  void takeOrdinary(std::string_view line, std::size_t omitted);
  void dropCandidate();
  void handOut();

  LogListener &listener_;
  std::uint64_t offset_;               ///< of the next byte
  std::uint64_t lineOffset_;           ///< of the line that is being read
  std::string line_;                   ///< its bytes so far
  std::size_t lineOmitted_ = 0;        ///< those that are not kept
  std::vector<std::string> candidate_; ///< lines that may become a header block
  std::uint64_t candidateOffset_ = 0;
  bool hasMessage_ = false;
  LogMessage message_;
};

/// "14:02:33"; empty for -1.
std::string clockText(int time);

/// "error", "info" or "trace".
const char *levelName(LogLevel level);
