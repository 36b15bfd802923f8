#include "transaction/page.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <utility>

#include "text.h"
#include "transaction/pagestyle.h"

namespace {

/// What is beyond these is in record.json alone: a page of 50,000 lines is not read, and takes a browser
/// long.
constexpr std::size_t MostFiles = 2000;
constexpr std::size_t MostOutput = 64UL * 1024;

/// Whether the character at this place changes the direction of writing: U+200E, U+200F, U+202A to U+202E and
/// U+2066 to U+2069. A name with one of them is read as another one.
bool isDirection(const std::string &text, std::size_t at) {
  if (text.compare(at, 2, "\xE2\x80") == 0 && at + 2 < text.size()) {
    const auto last = static_cast<unsigned char>(text[at + 2]);
    return last == 0x8E || last == 0x8F || (last >= 0xAA && last <= 0xAE);
  }
  if (text.compare(at, 2, "\xE2\x81") != 0 || at + 2 >= text.size())
    return false;
  const auto last = static_cast<unsigned char>(text[at + 2]);
  return last >= 0xA6 && last <= 0xA9;
}

/// The same with the bytes of such characters written as those of control characters are.
std::string withoutDirections(const std::string &text) {
  std::string result;
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (!isDirection(text, at)) {
      result += text[at];
      continue;
    }
    char bytes[16];
    snprintf(bytes, sizeof bytes, R"(\xE2\x%02X\x%02X)", static_cast<unsigned char>(text[at + 1]),
             static_cast<unsigned char>(text[at + 2]));
    result += bytes;
    at += 2;
  }
  return result;
}

/// Bytes from outside as text of a document: nothing in them is markup, and no control character is left.
std::string escaped(const std::string &bytes) {
  std::string text;
  for (const char c : withoutDirections(terminalText(bytes))) {
    switch (c) {
    case '&':
      text += "&amp;";
      break;
    case '<':
      text += "&lt;";
      break;
    case '>':
      text += "&gt;";
      break;
    case '"':
      text += "&quot;";
      break;
    case '\'':
      text += "&#39;";
      break;
    default:
      text += c;
    }
  }
  return text;
}

std::string code(const std::string &bytes) {
  return "<code>" + escaped(bytes) + "</code>";
}

/// The same line by line.
std::string escapedLines(const std::string &bytes) {
  std::string text;
  for (std::size_t start = 0; start < bytes.size();) {
    const std::size_t end = std::min(bytes.find('\n', start), bytes.size());
    text += escaped(bytes.substr(start, end - start)) + "\n";
    start = end + 1;
  }
  return text;
}

std::string number(double value, const char *format) {
  char text[64];
  snprintf(text, sizeof text, format, value);
  return text;
}

std::string counted(std::size_t count, const std::string &what) {
  return std::to_string(count) + " " + what + (count == 1 ? "" : "s");
}

std::string cell(const char *name, const std::string &html) {
  return std::string(R"(<td data-name=")") + name + "\">" + html + "</td>";
}

/// One that keeps its width beside long names.
std::string shortCell(const char *name, const std::string &html) {
  return std::string(R"(<td class="short" data-name=")") + name + "\">" + html + "</td>";
}

bool endedWell(const Record &record) {
  return record.verdict == "applied" || (record.verdict == "undone" && record.action == "undo");
}

/// An installation that was killed has none, also when a part of it was taken back since.
std::string verdictOf(const Record &record) {
  return record.verdict.empty() ? "interrupted" : record.verdict;
}

/// The verdict in a sentence.
std::string meaningOf(const Record &record) {
  if (record.verdict.empty())
    return "The installation did not come to its end.";
  if (record.verdict == "applied")
    return "The patches are installed, and every file was verified.";
  if (record.verdict == "failed")
    return "The installer ended with status " + std::to_string(record.installer.status) +
           "; what it did is still in place.";
  if (record.verdict == "undone")
    return "The files, levels and instances are as they were before the installation.";
  if (record.action == "undo")
    return "A part could not be taken back: see the messages.";
  return "The installer ended well, but the home is not as the patches want it: see the differences.";
}

class Page {
public:
  explicit Page(const Record &record) : record_(record) {}

  std::string write() {
    head();
    verdict();
    patches();
    timeline();
    differences();
    messages();
    findings();
    instances();
    files();
    otherChanges();
    output("Output of the installer", record_.installer.out);
    output("Errors of the installer", record_.installer.err);
    html_ += "</main>\n</body>\n</html>\n";
    return std::move(html_);
  }

private:
  void head() {
    html_ += "<!DOCTYPE html>\n<html lang=\"en\">\n<head>\n<meta charset=\"utf-8\">\n"
             "<meta http-equiv=\"Content-Security-Policy\" content=\"default-src 'none'; "
             "style-src 'unsafe-inline'; img-src data:\">\n"
             "<meta name=\"viewport\" content=\"width=device-width, initial-scale=1\">\n"
             "<link rel=\"icon\" href=\"data:,\">\n<title>" +
             escaped(record_.id) + ": " + escaped(verdictOf(record_)) + "</title>\n<style>" + PageStyle +
             "</style>\n</head>\n<body>\n";
  }

  void verdict() {
    const std::string kind = endedWell(record_) ? "good" : "bad";
    html_ += "<header class=\"" + kind + "\">\n<h1 class=\"" + kind + "\">" + escaped(verdictOf(record_)) +
             "</h1>\n<p>" + escaped(meaningOf(record_)) + "</p>\n</header>\n<main>\n<dl>\n";
    fact("Home", code(record_.home));
    fact("Transaction", code(record_.id));
    if (!record_.undoes.empty())
      fact("Takes back", code(record_.undoes));
    fact("User", code(record_.user));
    fact("Started", escaped(record_.started));
    fact("Ended", escaped(record_.ended));
    html_ += "</dl>\n";
  }

  void fact(const char *name, const std::string &html) {
    html_ += std::string("<dt>") + name + "</dt><dd>" + html + "</dd>\n";
  }

  void heading(const std::string &text) { html_ += "<h2>" + text + "</h2>\n"; }

  void patches() {
    heading("Products");
    html_ += "<table>\n<thead><tr><th>Product</th><th>Patch</th><th>Level</th><th>Result</th></tr></thead>\n"
             "<tbody>\n";
    for (const RecordedPatch &patch : record_.patches) {
      const bool isGood = patch.result == "PASS";
      html_ +=
          "<tr>" + cell("Product", code(patch.product) + " <small>" + escaped(patch.target) + "</small>") +
          cell("Patch", escaped(patch.name) + "<br>" + code(patch.file) + "<br><small>" + code(patch.sha256) +
                            "</small>") +
          shortCell("Level", escaped(patch.levelBefore) + " &rarr; " + escaped(patch.levelAfter)) +
          shortCell("Result", std::string("<span class=\"") + (isGood ? "good" : "bad") + "\">" +
                                  (patch.result.empty() ? "not tried" : escaped(patch.result)) + "</span>") +
          "</tr>\n";
    }
    html_ += "</tbody>\n</table>\n";
  }

  /// A line a step: its name and duration, and below them a bar at the time when it ran. All widths are
  /// parts of the page's, so that the texts keep their size on any screen.
  void timeline() {
    if (record_.steps.empty())
      return;
    constexpr std::size_t RowHeight = 40;
    double total = 0;
    for (const RecordedStep &step : record_.steps)
      total += step.seconds;
    heading("Steps");
    html_ += R"(<svg role="img" width="100%" height=")" + std::to_string(RowHeight * record_.steps.size()) +
             R"(" aria-label="Timeline of the steps, )" + number(total, "%.2f") + " seconds\">\n";
    double start = 0;
    std::size_t top = 0;
    for (const RecordedStep &step : record_.steps) {
      bar(step, top, start, total);
      start += step.seconds;
      top += RowHeight;
    }
    html_ += "</svg>\n";
  }

  void bar(const RecordedStep &step, std::size_t top, double start, double total) {
    const double whole = total > 0 ? total : 1;
    const std::string from = number(100 * start / whole, "%.3f%%");
    const std::string mark = number(std::min(100 * start / whole, 99.5), "%.3f%%");
    const char *const kind = step.result == "ok" ? "ok" : "failed";
    html_ += R"(<text x="0" y=")" + std::to_string(top + 15) + "\">" + escaped(step.step) + "  " +
             number(step.seconds, "%.2f s") + (step.result == "ok" ? "" : "  " + escaped(step.result)) +
             "</text>\n" + rect("rail", "0", "100%", top) +
             rect(kind, from, number(100 * step.seconds / whole, "%.3f%%"), top) +
             rect(kind, mark, "2", top); // what takes no time is seen too
  }

  static std::string rect(const std::string &kind, const std::string &from, const std::string &width,
                          std::size_t top) {
    return R"(<rect class=")" + kind + R"(" height="10" x=")" + from + R"(" y=")" + std::to_string(top + 20) +
           R"(" width=")" + width + "\"/>\n";
  }

  void differences() {
    if (record_.differences.empty())
      return;
    heading(counted(record_.differences.size(), "difference"));
    html_ += "<ul>\n";
    for (const Difference &difference : record_.differences)
      html_ += "<li><span class=\"bad\">" + escaped(difference.kind) + "</span> " + code(difference.path) +
               ": " + escaped(difference.text) + "</li>\n";
    html_ += "</ul>\n";
  }

  void messages() { list("message", record_.messages); }

  void list(const std::string &what, const std::vector<std::string> &lines) {
    if (lines.empty())
      return;
    heading(counted(lines.size(), what));
    html_ += "<ul>\n";
    for (const std::string &line : lines)
      html_ += "<li>" + code(line) + "</li>\n";
    html_ += "</ul>\n";
  }

  void findings() {
    if (record_.findings.empty())
      return;
    heading(counted(record_.findings.size(), "finding"));
    html_ += "<ul>\n";
    for (const Finding &finding : record_.findings) {
      const bool isError = finding.severity == Severity::Error;
      html_ += std::string("<li><span class=\"") + (isError ? "bad\">error" : "warn\">warning") + "</span> " +
               code(finding.rule) + " " + (finding.patch.empty() ? "" : code(finding.patch) + " ") +
               (finding.where.empty() ? "" : code(finding.where)) + "<br>" + escaped(finding.text) +
               "<br><small>" + escaped(finding.remedy) + "</small></li>\n";
    }
    html_ += "</ul>\n";
  }

  void instances() {
    if (record_.before.empty() && record_.after.empty())
      return;
    heading("Instances");
    html_ += "<table>\n<thead><tr><th>Instance</th><th>User</th><th>Before</th><th>After</th></tr></thead>\n"
             "<tbody>\n";
    for (const RecordedInstance &instance : record_.before)
      instanceRow(instance, true, isAmong(record_.after, instance));
    for (const RecordedInstance &instance : record_.after)
      if (!isAmong(record_.before, instance))
        instanceRow(instance, false, true);
    html_ += "</tbody>\n</table>\n";
  }

  void instanceRow(const RecordedInstance &instance, bool before, bool after) {
    const std::string stopped =
        std::string("<span class=\"") + (before ? "bad" : "soft") + "\">does not run</span>";
    html_ += "<tr>" + cell("Instance", code(instance.product) + " " + code(instance.name)) +
             cell("User", code(instance.user)) + shortCell("Before", before ? "runs" : "did not run") +
             shortCell("After", after ? "runs" : stopped) + "</tr>\n";
  }

  void files() {
    if (record_.files.empty())
      return;
    heading(counted(record_.files.size(), "file"));
    fileGroup("New", false);
    fileGroup("Replaced", true);
  }

  void fileGroup(const std::string &name, bool replaced) {
    std::size_t count = 0;
    std::string items;
    for (const TouchedFile &file : record_.files)
      if (file.before.has_value() == replaced && ++count <= MostFiles)
        items += "<li>" + code(file.path) + "</li>\n";
    if (count == 0)
      return;
    html_ +=
        "<h3>" + name + " (" + std::to_string(count) + ")</h3>\n<ul class=\"files\">\n" + items + "</ul>\n";
    if (count > MostFiles)
      html_ += "<p class=\"soft\">The first " + std::to_string(MostFiles) + "; record.json has all.</p>\n";
  }

  void otherChanges() {
    if (record_.otherChanges.empty())
      return;
    list("other change", record_.otherChanges);
    html_ += "<p class=\"soft\">Commands of the patches, or others, did that; an undo leaves it.</p>\n";
  }

  void output(const std::string &name, const std::string &text) {
    if (text.empty())
      return;
    heading(name);
    const bool isLong = text.size() > MostOutput;
    if (isLong)
      html_ += "<p class=\"soft\">The end of it; record.json has all.</p>\n";
    html_ += "<pre>" + escapedLines(isLong ? text.substr(text.size() - MostOutput) : text) + "</pre>\n";
  }

  const Record &record_;
  std::string html_;
};

} // namespace

std::string pageOf(const Record &record) {
  return Page(record).write();
}

void writePage(const std::string &folder, Record &record) {
  const int error = replaceFile(folder + "/record.html", pageOf(record));
  if (error != 0)
    record.messages.push_back(std::string("record.html cannot be written: ") + strerror(error));
}
