// The table of the rules for the host.
#include <algorithm>
#include <iterator>

#include "check/hostcheck.h"

namespace {

constexpr Severity E = Severity::Error;
constexpr Severity W = Severity::Warning;

const std::vector<Rule> rules = {
    {"home-path", E, "The path of the home is not one that the product can live under.",
     "The installer builds command lines from it: a relative path is lost when it changes directories, a "
     "blank splits "
     "commands, \"grep\" hides processes, \":\" splits the search path.",
     "Give the absolute path without links, of letters, digits and / _ - . + only, and without the word "
     "grep."},
    {"home-tmp", E, "HOME/tmp can be changed by others than the runner.",
     "Archives are extracted there, and commands are run from there: who may write there runs commands as "
     "the runner.",
     "Give HOME/tmp to the user who patches, as a directory of mode 0700."},
    {"tmp-leftover", W, "A temporary directory of an earlier run is left.",
     "The installer removes it before it extracts; after a run that was killed it may hold the only copy of "
     "a file.",
     "Run orvpatchctl recover first, or remove the directory when it holds nothing that the home lacks."},
    {"patch-in-tmp", E, "The patch file lies in HOME/tmp.",
     "The installer removes the temporary directory of the product before it extracts, with everything in "
     "it.",
     "Move the patch file out of HOME/tmp."},
    {"no-hard-link", E, "No file can be linked from HOME/tmp to a directory that the patch touches.",
     "The installer moves files by hard link, after it has removed the old file: the old file would be lost.",
     "Bring the directory to the file system of the home, make it writable, or patch as the user who owns "
     "it."},
    {"space", E, "There is not enough room for the extracted archive.",
     "The extraction fails in the middle; with a full disk also level and history may be lost.",
     "Make room on the file system of the home."},
    {"inodes", E, "There are not enough inodes for the extracted archive.",
     "The extraction fails in the middle.", "Remove files on the file system of the home."},
    {"target-immutable", E, "A file or directory that the patch replaces is immutable or append-only.",
     "The installer ends with 25 at this file, after it has moved others.",
     "Take the attribute away with chattr."},
    {"target-is-link", W, "A file that the patch replaces is a symbolic link.",
     "The link itself is replaced; the file that it leads to stays, and gives its owner and mode to the new "
     "file.",
     "Make sure that the link may go."},
    {"target-is-directory", E, "The home has a directory where the patch has a file.",
     "A directory is not removed for a file: the installer ends with 25.", "Move the directory away."},
    {"other-names", W, "A file that the patch replaces has further hard links.",
     "The other names keep the old content.", "Replace the other names too, after the patch."},
    {"attributes-lost", W, "A file that the patch replaces has attributes that the new one will not have.",
     "The installer takes over owner, group and mode, but no ACL, capabilities or extended attributes.",
     "Note them, and set them again after the patch."},
    {"registry-writable", W, "The registry can be changed by others than the runner and root.",
     "It decides whether a patch applies, and which file is rewritten as a version file.",
     "Give HOME/registry and its files to the user who patches, mode 0755 and 0644."},
    {"runinfo-writable", W, "The run information can be changed by others than the runner and root.",
     "Instance names in it become part of a command line that the installer runs.",
     "Give the file to the user who patches, or look at it before each patch."},
    {"runinfo-syntax", W, "The run information has a line that the installer does not take as it is meant.",
     "Instances of such a line are not stopped, or are started by a wrong command.", "Correct the line."},
    {"host-prefix", W, "The run information has a line of another host that begins with this host's name.",
     "The installer compares the start of the name only and takes the line for its own.",
     "Make sure that the process id of this line is not in use on this host."},
    {"owner-truncated", E, "ps shows the owner of an agent otherwise than by the login name.",
     "Names longer than 8 characters are cut; the installer then cannot start the agent again as its owner.",
     "Stop the agent before the patch and start it afterwards by hand."},
    {"owner-unknown", E, "The owner of an agent has no account on this host.",
     "The installer cannot start the agent again as its owner.",
     "Stop the agent before the patch and start it afterwards by hand."},
    {"wrong-user", E, "An agent of another user would be stopped, and cannot be started again by the runner.",
     "Only root may start an agent as its owner; the installer ends with 20.",
     "Patch as root, or stop the agent before the patch."},
    {"tool-missing", E, "A tool that the installer runs is missing or is not the one that it expects.",
     "Without GNU tar, the ps of procps, grep or su the installer fails, or takes running agents for "
     "stopped.",
     "Install the tool, or name its directory with --path."},
    {"clock-behind", W, "The clock of this host is behind the files of the patch or the log.",
     "tar complains about each file of the future; times in log and history are wrong.", "Set the clock."},
    {"other-run", E, "Another run is at work on this home.",
     "Two runs share HOME/tmp: either may fail, and an old file may be lost.", "Wait until it has ended."},
    {"signature-missing", E, "There is no signature for the patch.",
     "Nothing shows where the patch comes from; it runs commands as the runner.",
     "Get SHA256SUMS and SHA256SUMS.asc from the patch's maker."},
    {"signature-bad", E, "The signature or the checksum of the patch is wrong.",
     "The file is not the one that its maker has signed.", "Do not install it; get it again."},
    {"installer-refuses", E, "The installer's report ended with an error.",
     "An installation would end in the same way.", "See the installer's own message."},
};

} // namespace

const std::vector<Rule> &hostRules() {
  return rules;
}

void HostCheck::add(const std::string &rule, const std::string &patch, const std::string &where,
                    const std::string &text) {
  const auto found = std::find_if(rules.begin(), rules.end(),
                                  [&rule](const Rule &candidate) { return rule == candidate.name; });
  addAs(found == rules.end() ? E : found->severity, rule, patch, where, text);
}

void HostCheck::addAs(Severity severity, const std::string &rule, const std::string &patch,
                      const std::string &where, const std::string &text) {
  const auto found = std::find_if(rules.begin(), rules.end(),
                                  [&rule](const Rule &candidate) { return rule == candidate.name; });
  findings_.push_back({rule, severity, patch, where, text, found == rules.end() ? "" : found->remedy});
}

bool HostCheck::has(const std::string &rule) const {
  return std::any_of(findings_.begin(), findings_.end(),
                     [&rule](const Finding &finding) { return finding.rule == rule; });
}

std::set<std::string> HostCheck::temporaryCodes() const {
  std::set<std::string> codes;
  for (const Patch &patch : patches) {
    codes.insert(patch.name.getProduct());
    if (patch.descriptor != nullptr)
      codes.insert(patch.descriptor->getProductCode());
  }
  return codes;
}
