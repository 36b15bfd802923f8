// build: the archive of a source tree, its line in SHA256SUMS, a signature of that list. All three are made
// in a private folder beside their places and moved there once lint has found no error.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>
#include <unistd.h>

#include "archivewriter.h"
#include "checksums.h"
#include "child.h"
#include "commands/command.h"
#include "commands/commands.h"
#include "file.h"
#include "lint/lint.h"
#include "patchdescriptor.h"
#include "productkind.h"
#include "temporaryfolder.h"
#include "text.h"

namespace {

constexpr const char *ListName = "SHA256SUMS";
constexpr const char *SignatureName = "SHA256SUMS.asc";

struct BuildOptions {
  std::string tree;
  std::string folder = ".";
  std::string platform;
  std::string target;
  std::string fixpack;
  std::string key;
};

struct Built {
  std::string archive; ///< path
  std::string checksum;
  std::string signature; ///< path; empty without a key
};

/// The time of SOURCE_DATE_EPOCH, when it is set.
std::optional<std::int64_t> latestTime() {
  const char *const text = getenv("SOURCE_DATE_EPOCH");
  if (text == nullptr || *text == '\0')
    return std::nullopt;
  char *end = nullptr;
  errno = 0;
  const long long seconds = strtoll(text, &end, 10);
  if (errno != 0 || *end != '\0' || seconds < 0)
    throw JudgementError(std::string("SOURCE_DATE_EPOCH is no number of seconds: ") + text);
  return seconds;
}

/// The name of the archive; what the command line does not say comes from the descriptor.
std::string archiveName(const BuildOptions &options) {
  PatchError error;
  const std::unique_ptr<PatchDescriptor> descriptor(
      PatchDescriptor::parseFile(options.tree + "/patch.ini", &error));
  if (descriptor == nullptr)
    throw JudgementError(error.text);
  const std::string product = descriptor->getProductCode();
  const std::vector<std::string> platforms = descriptor->getArch();
  const Version &level = *descriptor->getVersion();
  const auto orElse = [](const std::string &given, const std::string &other) {
    return given.empty() ? other : given;
  };
  const std::string name =
      product + "_" + orElse(options.platform, platforms.empty() ? "lpp266" : platforms.front()) + "_" +
      orElse(options.target, kindOf(product)) + "_" +
      orElse(options.fixpack, std::string("fp") + level.getMM() + level.getFF()) + ".tar";
  if (name.find('/') != std::string::npos)
    throw JudgementError("no name of a file: " + name);
  return name;
}

void writeFile(const std::string &path, const std::string &text) {
  std::ofstream file(path, std::ios::binary);
  file << text;
  file.close();
  if (!file)
    throw JudgementError("cannot write " + path);
}

std::string contentOf(const std::string &path) {
  std::ifstream file(path, std::ios::binary);
  std::ostringstream content;
  content << file.rdbuf();
  return content.str();
}

/// The caller's variables that gpg needs to find its keys and to ask for a passphrase.
std::vector<std::string> signingEnvironment() {
  std::vector<std::string> variables;
  for (const char *const name : {"HOME", "GNUPGHOME", "GPG_TTY", "TERM", "DISPLAY", "LANG"})
    if (const char *const value = getenv(name))
      variables.push_back(std::string(name) + "=" + value);
  return variables;
}

void sign(const std::string &folder, const std::string &key) {
  std::vector<std::string> words = {"gpg",     "--batch",       "--yes",
                                    "--armor", "--detach-sign", "--local-user",
                                    key,       "--output",      folder + "/" + SignatureName};
  if (isatty(STDIN_FILENO) != 1)
    words.insert(words.begin() + 1, {"--pinentry-mode", "error"});
  words.push_back(folder + "/" + ListName);
  const ChildResult gpg = runChild(words, {"/usr/local/bin:/usr/bin:/bin", signingEnvironment()});
  if (gpg.status != 0)
    throw JudgementError("cannot sign with the key " + key + ": " + gpg.err);
}

void moveTo(const std::string &from, const std::string &to) {
  if (rename(from.c_str(), to.c_str()) != 0)
    throw JudgementError("cannot write " + to + ": " + strerror(errno));
}

/// A signature of a list that has changed is none any more.
void dropOldSignature(const std::string &path) {
  if (unlink(path.c_str()) == 0)
    fprintf(stderr, "orvpatchctl: removed %s, which signed another list; sign the new one with --sign\n",
            terminalText(path).c_str());
}

/// Moves everything to its place. The archive comes first: a list that names what is not there would be
/// worse.
Built publish(const BuildOptions &options, const std::string &name, const std::string &made) {
  const std::string folder = options.folder + "/";
  Built built = {folder + name, sha256OfFile(made + "/" + name), ""};
  const std::string list = checksumListWith(folder + ListName, name, built.checksum);
  const bool isListChanged = list != contentOf(folder + ListName);
  writeFile(made + "/" + ListName, list);
  if (!options.key.empty())
    sign(made, options.key);
  moveTo(made + "/" + name, built.archive);
  moveTo(made + "/" + ListName, folder + ListName);
  if (!options.key.empty()) {
    built.signature = folder + SignatureName;
    moveTo(made + "/" + SignatureName, built.signature);
  } else if (isListChanged) {
    dropOldSignature(folder + SignatureName);
  }
  return built;
}

nlohmann::ordered_json textOrNull(const std::string &text) {
  return text.empty() ? nlohmann::ordered_json(nullptr) : nlohmann::ordered_json(jsonText(text));
}

void print(const Built &built, const FindingList &findings, const OutputOptions &output) {
  if (output.json) {
    nlohmann::ordered_json document = {{"archive", textOrNull(built.archive)},
                                       {"sha256", textOrNull(built.checksum)},
                                       {"signature", textOrNull(built.signature)}};
    document.update(toJson(findings));
    printDocument(document);
    return;
  }
  if (!findings.empty())
    printFindings(findings, output);
  if (built.archive.empty())
    printf("Nothing was built.\n");
  else
    printf("%s\nSHA-256  %s\n", terminalText(built.archive).c_str(), built.checksum.c_str());
  if (!built.signature.empty())
    printf("Signed   %s\n", terminalText(built.signature).c_str());
}

void build(const BuildOptions &options, Invocation &invocation) {
  if (!File(options.tree).isDirectory())
    throw JudgementError("no directory: " + options.tree);
  const std::string name = archiveName(options);
  const TemporaryFolder folder(options.folder);
  writePatchArchive(options.tree, folder.path() + "/" + name, latestTime());
  const FindingList findings = lint(folder.path() + "/" + name);
  const bool isGood = count(findings, Severity::Error) == 0;
  const Built built = isGood ? publish(options, name, folder.path()) : Built();
  print(built, findings, invocation.output);
  invocation.status = isGood ? Good : Findings;
}

} // namespace

void addBuild(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "build", "Make the archive of a source tree");
  const auto options = std::make_shared<BuildOptions>();
  command->add_option("directory", options->tree, "The source tree")->required()->option_text("DIR");
  command->add_option("-o,--output", options->folder, "Where the archive is put (default: here)")
      ->option_text("FOLDER");
  command
      ->add_option("--platform", options->platform,
                   "Platform of the name (default: productBinArch, or lpp266)")
      ->option_text("PLATFORM");
  command->add_option("--target", options->target, "Kind of the name (default: that of the product)")
      ->option_text("KIND");
  command
      ->add_option("--fixpack", options->fixpack,
                   "Fix pack of the name (default: fp and the end of the level)")
      ->option_text("FIXPACK");
  command->add_option("--sign", options->key, "Sign SHA256SUMS with this key of gpg")->option_text("KEY");
  command->callback([options, &invocation] { build(*options, invocation); });
}
