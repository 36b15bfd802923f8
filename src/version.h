// A product level VVRRMMFF: version, release, modification and fix level, two characters each.
//
// Levels are text, not numbers, and reading one never fails: unreadable text becomes 06.10.00.00 and a trace
// line. Equality ignores the fix level, the order includes it; callers choose on purpose.
#pragma once

#include <string>

class Version {
public:
  /// The default level 06.10.00.00.
  Version();

  /// At most two characters of each part; a shorter part stays short, nothing is padded.
  Version(const char *vv, const char *rr, const char *mm, const char *ff);

  /// See set().
  explicit Version(const std::string &text);

  Version(const Version &other) = default;
  Version &operator=(const Version &other) = default;
  virtual ~Version() = default;

  /// Reads VVRRMM, VV.RR.MM, VVRRMMFF or VV.RR.MM.FF, told apart by length and dots alone.
  /// Always writes one trace line with the form that was recognised.
  void set(const std::string &text);

  /// The fields; the pointers are valid while the object lives.
  const char *getVV() const { return vv_; }
  const char *getRR() const { return rr_; }
  const char *getMM() const { return mm_; }
  const char *getFF() const { return ff_; }

  std::string getVersionString() const;       ///< "12345600"
  std::string getDottedVersionString() const; ///< "12.34.56.00"

private:
  static constexpr int FieldSize = 3; // two characters and the terminating NUL

  void store(const char *vv, const char *rr, const char *mm, const char *ff);

  char vv_[FieldSize];
  char rr_[FieldSize];
  char mm_[FieldSize];
  char ff_[FieldSize];
};

/// Same version, release and modification; the fix level is ignored.
bool operator==(const Version &a, const Version &b);
bool operator!=(const Version &a, const Version &b);

/// Byte-wise order of the plain version strings, fix level included.
bool operator<(const Version &a, const Version &b);
bool operator<=(const Version &a, const Version &b);
bool operator>(const Version &a, const Version &b);
bool operator>=(const Version &a, const Version &b);
