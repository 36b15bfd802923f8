#include "fakehome.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <unistd.h>

#include "utilities.h"

namespace fs = std::filesystem;

namespace {

constexpr unsigned Executable = 0755;
constexpr uid_t Nobody = 65534;

/// Answers from files beside itself: one for every process that "-p" finds, one for all that "-ef" lists.
const char *const PsScript = R"(#!/bin/sh
case "$1" in
  -p) shown="${0%/*}/process.$2"; echo '    PID TTY          TIME CMD' ;;
  *) shown="${0%/*}/all"; echo 'UID          PID    PPID  C STIME TTY          TIME CMD' ;;
esac
[ -f "$shown" ] || exit 1
while IFS= read -r line; do printf '%s\n' "$line"; done <"$shown"
)";

std::string nameOfUser(const std::string &owner) {
  return owner == RunRow::currentUser ? Util::getUserName() : owner;
}

/// A call in short: program and arguments of a line of the control scripts' journal; any other line is
/// itself.
std::string callIn(const std::string &line) {
  constexpr char Separator = '\x1f';
  constexpr int FieldsBeforeArguments = 5;
  std::istringstream fields(line);
  std::string call;
  int number = 0;
  for (std::string field; std::getline(fields, field, Separator); ++number) {
    if (number == 0)
      call = field;
    else if (number >= FieldsBeforeArguments)
      call += " [" + field + "]";
  }
  if (!line.empty() && line.back() == Separator)
    call += " []";
  return call;
}

} // namespace

const std::string RunRow::currentUser = "<current user>";

Record recordOf(const PatchError &err) {
  return {err.code, err.text};
}

Printed printedBy(const std::function<bool()> &operation) {
  Printed printed;
  ::testing::internal::CaptureStdout();
  ::testing::internal::CaptureStderr();
  printed.result = operation();
  printed.err = ::testing::internal::GetCapturedStderr();
  printed.out = ::testing::internal::GetCapturedStdout();
  return printed;
}

std::string runInfoText(const std::vector<RunRow> &rows) {
  std::string text = "FIELDSEP=|\n";
  for (const RunRow &row : rows)
    text += Util::getHostName() + "|" + row.code + "|" + row.pid + "|" + row.instance + "|5\n";
  return text;
}

LogLines commandLines(const std::vector<std::string> &words) {
  LogLines lines = {trace("process.cpp", "runCommand entry")};
  for (std::size_t i = 0; i < words.size(); ++i)
    lines.push_back(trace("process.cpp", "cmdArray[" + std::to_string(i) + "]: " + words[i]));
  lines.push_back(trace("process.cpp", "runCommand exit"));
  return lines;
}

LogLines joined(std::initializer_list<LogLines> parts) {
  LogLines all;
  for (const LogLines &part : parts)
    all.insert(all.end(), part.begin(), part.end());
  return all;
}

LogLines linesOf(const std::string &component, LogLines lines) {
  lines.erase(std::remove_if(lines.begin(), lines.end(),
                             [&](const LogLine &line) { return line.component != component; }),
              lines.end());
  return lines;
}

LogLines traces(const std::string &component, const std::vector<std::string> &messages) {
  LogLines lines;
  for (const std::string &message : messages)
    lines.push_back(trace(component, message));
  return lines;
}

void FakeHome::SetUp() {
  ScratchHome::SetUp();
  makeDirectory("bin");
  fs::copy(SUPPORT_FOLDER "/quill", home() + "bin");
  makeDirectory("control/answers");
  write("ps/ps", PsScript, Executable);
  // Not the caller's PATH: a folder on it that the user may not enter changes the error number of a program
  // that is nowhere.
  setenv("PATH", (home() + "ps:/usr/bin:/bin").c_str(), 1);
}

std::string FakeHome::install(const std::string &file, const std::string &level,
                              const std::string &description, const std::vector<std::string> &prereqs) const {
  std::string text = "desc = " + description + "\nVRMF = " + level + "\n";
  for (const std::string &prereq : prereqs)
    text += "preReqALL = " + prereq + "\n";
  return write("registry/" + file, text);
}

void FakeHome::setRunning(const std::vector<RunRow> &rows) const {
  write("config/.ConfigData/RunInfo", runInfoText(rows));
  for (const RunRow &row : rows)
    setProcess(row.pid, row.owner);
}

void FakeHome::setProcess(const std::string &pid, const std::string &owner) const {
  setPsOfProcess(pid, pid + " ?        00:00:00 agent\n");
  setPsOfAll(read(home() + "ps/all") + nameOfUser(owner) + "  " + pid +
             "  1  0 08:00 ?        00:00:00 agent\n");
}

void FakeHome::endProcess(const std::string &pid) const {
  fs::remove(home() + "ps/process." + pid);
}

void FakeHome::setPsOfProcess(const std::string &pid, const std::string &text) const {
  write("ps/process." + pid, text);
}

void FakeHome::setPsOfAll(const std::string &text) const {
  write("ps/all", text);
}

void FakeHome::onCall(const std::string &call, const std::string &shell) const {
  write("control/answers/" + call, "home=$quill_home\n" + shell + "\n");
}

std::vector<std::string> FakeHome::journal() const {
  std::ifstream in(home() + "journal");
  std::vector<std::string> lines;
  for (std::string line; std::getline(in, line);)
    lines.push_back(callIn(line));
  return lines;
}

LogLines FakeHome::expectFailure(const std::string &component, const Record &expected,
                                 const std::function<bool(PatchError *)> &operation) {
  logLines();
  PatchError err{99, "of an earlier failure"};
  printedByFailure_ = printedBy([&] { return operation(&err); });
  EXPECT_FALSE(printedByFailure_.result);
  EXPECT_EQ(recordOf(err), expected);
  const LogLines lines = logLinesOf(component);
  const Printed again = printedBy([&] { return operation(nullptr); });
  EXPECT_FALSE(again.result);
  EXPECT_EQ(again.out, printedByFailure_.out);
  EXPECT_EQ(again.err, printedByFailure_.err);
  EXPECT_EQ(logLinesOf(component), lines) << "without a record the log must read the same";
  return lines;
}

std::vector<std::string> listedNames(const std::string &directory) {
  std::vector<std::string> names;
  for (const fs::directory_entry &entry : fs::directory_iterator(directory))
    names.push_back(entry.path().filename().string());
  return names;
}

std::vector<std::string> treeOf(const std::string &directory) {
  std::vector<std::string> paths;
  if (!fs::is_directory(directory))
    return paths;
  for (const fs::directory_entry &entry : fs::recursive_directory_iterator(directory)) {
    const std::string path = fs::relative(entry.path(), directory).string();
    paths.push_back(entry.is_directory() ? path + "/" : path);
  }
  std::sort(paths.begin(), paths.end());
  return paths;
}

RealUserScope::RealUserScope() {
  if (runsAsRoot()) {
    EXPECT_EQ(setreuid(Nobody, 0), 0);
  }
}
RealUserScope::~RealUserScope() {
  if (runsAsRoot()) {
    EXPECT_EQ(setreuid(0, 0), 0);
  }
}

BoundByPermissions::BoundByPermissions(const std::string &tree) {
  if (!runsAsRoot())
    return;
  EXPECT_EQ(chown(tree.c_str(), Nobody, Nobody), 0);
  for (const fs::directory_entry &entry : fs::recursive_directory_iterator(tree)) {
    EXPECT_EQ(lchown(entry.path().c_str(), Nobody, Nobody), 0);
  }
  EXPECT_EQ(seteuid(Nobody), 0);
}
BoundByPermissions::~BoundByPermissions() {
  if (getuid() == 0) {
    EXPECT_EQ(seteuid(0), 0);
  }
}
