// Two levels, one to a line: how each is read, and that their comparisons agree.
#include <cstring>

#include "fuzz.h"
#include "version.h"

namespace {

using Fields = std::vector<std::string>;

/// The four fields that this text stands for; the default level for what is no level.
Fields expectedFields(const std::string &text) {
  std::vector<std::size_t> starts;
  const auto dotted = [&text](std::size_t position) { return text[position] == '.'; };
  if (text.size() == 6)
    starts = {0, 2, 4};
  else if (text.size() == 8)
    starts =
        dotted(2) && dotted(5) ? std::vector<std::size_t>{0, 3, 6} : std::vector<std::size_t>{0, 2, 4, 6};
  else if (text.size() == 11 && dotted(2) && dotted(5) && dotted(8))
    starts = {0, 3, 6, 9};
  else
    return {"06", "10", "00", "00"};
  Fields fields(4, "00");
  for (std::size_t i = 0; i < starts.size(); ++i)
    fields[i] = fuzz::upToNul(text.substr(starts[i], 2));
  return fields;
}

Fields fieldsOf(const Version &version) {
  return {version.getVV(), version.getRR(), version.getMM(), version.getFF()};
}

void checkReading(const std::string &text) {
  const Version version(text);
  const Fields fields = expectedFields(text);
  REQUIRE(fieldsOf(version) == fields);
  const std::string plain = fields[0] + fields[1] + fields[2] + fields[3];
  REQUIRE(version.getVersionString() == plain);
  REQUIRE(version.getDottedVersionString() ==
          fields[0] + "." + fields[1] + "." + fields[2] + "." + fields[3]);

  const Version copy = version;
  REQUIRE(fieldsOf(copy) == fields);
  Version again("99.99.99.99");
  again.set(text);
  REQUIRE(fieldsOf(again) == fields);
  // What is written with dots is read back as it was, as long as no field has been cut short.
  if (plain.size() == 8)
    REQUIRE(fieldsOf(Version(version.getDottedVersionString())) == fields);
}

void checkComparison(const Version &a, const Version &b) {
  const int order = a.getVersionString().compare(b.getVersionString());
  REQUIRE((a < b) == (order < 0));
  REQUIRE((a > b) == (order > 0));
  REQUIRE((a <= b) == (order <= 0));
  REQUIRE((a >= b) == (order >= 0));
  REQUIRE((a < b) == (b > a));
  REQUIRE((a <= b) == (b >= a));
  const Fields left = fieldsOf(a);
  const Fields right = fieldsOf(b);
  REQUIRE((a == b) == (left[0] == right[0] && left[1] == right[1] && left[2] == right[2]));
  REQUIRE((a != b) == !(a == b));
  REQUIRE((a == b) == (b == a));
}

void checkParts(const std::string &a, const std::string &b) {
  const Version version(a.c_str(), b.c_str(), "", a.c_str());
  const Fields expected = {fuzz::upToNul(a).substr(0, 2), fuzz::upToNul(b).substr(0, 2), "",
                           fuzz::upToNul(a).substr(0, 2)};
  REQUIRE(fieldsOf(version) == expected);
}

} // namespace

void check(const std::string &input) {
  std::string second = input;
  const std::string first = fuzz::takeLine(second);
  checkReading(first);
  checkReading(second);
  checkComparison(Version(first), Version(second));
  checkComparison(Version(first), Version(first));
  checkParts(first, second);
}
