// The table of rules: what each says, why, and what to do. --explain and the manual page are made from it.
#include "lint/rules.h"

#include "lint/lint.h"

namespace {

constexpr Severity Error = Severity::Error;
constexpr Severity Warning = Severity::Warning;

std::vector<LintRule> nameRules() {
  return {
      {{"name-grammar", Error, "The file's name is not that of a patch.",
        "The installer decides by the name alone: such a file is refused, and in a directory passed over.",
        "Name it product_platform_kind_fixpack.tar, such as kxe_lpp266_vema_fp0001.tar."},
       nameGrammar,
       nullptr},
      {{"name-product-differs", Error,
        "The name's product is not the descriptor's product code in lower case.",
        "The archive is unpacked under the one and its files are looked for under the other: no file is "
        "installed, and the run is a success.",
        "Use one product code, in lower case, in both places."},
       nameProductDiffers,
       nullptr},
      {{"family-not-taken", Error, "The patch is for another platform family.",
        "The installer takes the families lpp and unix; others are refused.",
        "Build the patch for lpp or unix, or give it to the installer of its own platform."},
       familyNotTaken,
       nullptr},
      {{"support-patch", Error, "The product is never installed under the kind of the patch.",
        "The product is looked for under the patch's kind, where it cannot be found: the patch is refused "
        "with "
        "status 9 on every system.",
        "Use vems for kqa, veps for kpt, vepd for kdk, vecm for kzt, and vema for all other products."},
       supportPatch,
       nullptr},
      {{"vecm-product", Error, "A patch of the kind vecm is for another product than kzt.",
        "Only kzt is installed as a command-line component: the patch is refused with status 9 on every "
        "system.",
        "Use vecm for kzt only."},
       vecmProduct,
       nullptr},
  };
}

std::vector<LintRule> archiveRules() {
  return {
      {{"no-descriptor", Error, "The archive has no member patch.ini.",
        "The installer has tar extract exactly patch.ini: the patch is refused with status 3.",
        "Put patch.ini at the top of the archive, without \"./\" before its name."},
       noDescriptor,
       nullptr},
      {{"descriptor-invalid", Error, "The descriptor is not accepted.",
        "The installer cannot tell what the patch is for and refuses it.",
        "Complete the section ProductInfo. The message names only the last key that is missing, and may name "
        "an optional one."},
       descriptorInvalid,
       nullptr},
      {{"incomplete-archive", Error, "The archive ends too early.",
        "Of an archive that is cut off between two members tar extracts what is there without an error: a "
        "part "
        "of the files is installed, and the run is a success.",
        "Transfer or build the archive again."},
       incompleteArchive,
       nullptr},
      {{"tar-fails", Error, "tar cannot extract the archive.", "The installer ends with status 3.",
        "Build the archive again, with tar or with orvpatchctl build."},
       tarFails,
       nullptr},
      {{"tar-too-loud", Error, "tar writes more messages than a pipe holds.",
        "The installer waits for tar's end before it reads: tar waits for room, and the run never ends.",
        "Mend what tar tells; mostly these are times in the future."},
       tarTooLoud,
       nullptr},
      {{"checksum-differs", Error, "The file is not the one that SHA256SUMS lists.",
        "The installer checks no digest: a damaged or foreign archive is installed.",
        "Transfer the archive again; if it was built anew, list it anew."},
       checksumDiffers,
       nullptr},
  };
}

std::vector<LintRule> memberRules() {
  return {
      {{"link-member", Error, "A member is a symbolic link.",
        "The installer follows it: files are moved out of the folder that it leads to, and the file that it "
        "leads to gets another mode.",
        "Put the file itself into the archive; make links in a command."},
       linkMember,
       nullptr},
      {{"hard-link-member", Error, "A member is a hard link to another one.",
        "Both names become one file in the home: owner and mode given to one are the other's too, as is "
        "every "
        "later change.",
        "Put the file into the archive twice (tar --hard-dereference)."},
       hardLinkMember,
       nullptr},
      {{"special-member", Error, "A member is a pipe or a device.",
        "It is moved into the home as it is; an ordinary user cannot even extract a device.",
        "Leave it out; make it in a command."},
       specialMember,
       nullptr},
      {{"unsafe-name", Error, "A member's name is absolute or climbs out of its directory.",
        "tar refuses \"..\", and takes the \"/\" from an absolute name: the file stays in the temporary "
        "directory and is removed with it.",
        "Name members relative to the top of the archive."},
       unsafeName,
       nullptr},
      {{"long-name", Error, "A member's name is longer than a system takes.",
        "tar cannot make the file; the installer ends with status 3, or leaves its temporary directory "
        "behind.",
        "Use parts of at most 255 bytes and paths below 3,800."},
       longName,
       nullptr},
      {{"updated-files-no-directory", Error, "updated_files is a file.",
        "The installer changes into it: the patch fails after its commands have run and instances have been "
        "stopped.",
        "Make it a directory, laid out like the home."},
       updatedFilesNoDirectory,
       nullptr},
      {{"closed-directory", Error, "A directory's mode shuts out its owner.",
        "An ordinary user's run cannot list it: what is in it is not installed, and the run is a success.",
        "Give directories the mode 0755."},
       closedDirectory,
       nullptr},
  };
}

std::vector<LintRule> descriptorRules() {
  return {
      {{"nul-byte", Error, "The descriptor has a NUL byte.",
        "The installer reads up to the first one: all sections and entries behind it are ignored.",
        "Write patch.ini as plain text."},
       nulByte,
       nullptr},
      {{"section-twice", Error, "A section stands twice.",
        "The second one replaces the first: the entries of the first are ignored.", "Merge the two."},
       sectionTwice,
       nullptr},
      {{"key-twice", Error, "A key stands twice in its section.",
        "One of the two values is ignored; of a prerequisite under two names too.", "Leave one of them."},
       keyTwice,
       nullptr},
      {{"stray-line", Error, "An entry stands before the first section.",
        "It is ignored, but its error stays: a report that fails later ends with its status.",
        "Put it into its section, or \"#\" before it."},
       strayLine,
       nullptr},
      {{"looks-like-section", Error, "A line begins with \"[\" and is no section that the installer knows.",
        "It opens a section without a meaning: it and the entries below it are ignored.",
        "Write the name exactly, alone in its brackets; give a command another name."},
       looksLikeSection,
       nullptr},
      {{"level-digits", Error, "A part of the level has not two digits.",
        "Two characters of each part are used and nothing is filled up: the level comes out as another one, "
        "and the patch is refused or breaks the version file.",
        "Write two digits, such as 06."},
       levelDigits,
       nullptr},
      {{"prereq-level", Error, "A prerequisite's level is none.",
        "A level in another form than 061000, 06.10.00, 06100002 or 06.10.00.02 is taken for 06.10.00.00, "
        "and "
        "letters are higher than digits.",
        "Write the level in one of the four forms."},
       prereqLevel,
       nullptr},
      {{"prereq-kind", Error, "A prerequisite is never installed under the kind of the patch.",
        "Prerequisites are looked for under the patch's own kind: the patch is refused with status 9 on "
        "every "
        "system.",
        "Leave it out, and check in a command."},
       prereqKind,
       nullptr},
      {{"all-is-hidden", Error, "\"all\" is not the first of the dependents.",
        "It counts only as the first in the order of bytes; otherwise it is the code of a product that does "
        "not exist, and other agents keep running while files are replaced.",
        "Let \"all\" stand alone."},
       allIsHidden,
       nullptr},
  };
}

std::vector<LintRule> commandRules() {
  return {
      {{"command-cut", Error, "A command has a \"=\".",
        "The command is cut there: another program is run, or none is found and the patch fails.",
        "Put the command and its arguments into a script."},
       commandCut,
       nullptr},
      {{"command-has-blank", Error, "A command has arguments.",
        "No shell reads it: a program with that whole name is looked for, and the patch fails.",
        "Put the command and its arguments into a script."},
       commandHasBlank,
       nullptr},
      {{"command-not-found", Error, "A command is not there.",
        "It is neither at the top of the archive nor a program of the system: the patch fails half-way.",
        "Add it to the archive, at the top, under the same name."},
       commandNotFound,
       nullptr},
      {{"command-not-executable", Error, "A command is not executable.",
        "It cannot be run: the patch fails half-way.", "Give it the mode 0755."},
       commandNotExecutable,
       nullptr},
      {{"command-twice", Error, "A command stands twice in its list.", "It is run once.",
        "Give the second call a script of its own."},
       commandTwice,
       nullptr},
  };
}

std::vector<LintRule> setRules() {
  return {
      {{"same-product-twice", Error, "Two patches of the directory are for the same product.",
        "Both pass the check of levels before either is installed, and come in the order in which the "
        "directory is stored: the older one may come last.",
        "Install them one by one, or leave the newer one only."},
       nullptr,
       sameProductTwice},
      {{"prereq-in-same-set", Error, "A prerequisite comes with another patch of the directory.",
        "All patches are checked before the first is installed: the prerequisite counts as missing, and none "
        "is installed.",
        "Install the other patch first, by itself."},
       nullptr,
       prereqInSameSet},
      {{"companion-is-patch", Error, "A file that only accompanies a patch has the name of one.",
        "The installer takes it for a patch: the run fails, or a backup is installed too.",
        "Move it away, or change the beginning of its name; keep digests in SHA256SUMS."},
       nullptr,
       companionIsPatch},
  };
}

std::vector<LintRule> warnings() {
  return {
      {{"no-checksum", Warning, "The folder's SHA256SUMS does not list the patch.",
        "The installer checks no digest: a damaged archive is found by none of the checks.",
        "List it: sha256sum PATCH >>SHA256SUMS."},
       noChecksum,
       nullptr},
      {{"future-time", Warning, "A member's time is in the future.",
        "tar writes a message for each, and the installed file bears that time.",
        "Set the clock, or the times of the files."},
       futureTime,
       nullptr},
      {{"no-updated-files", Warning, "The archive has no directory updated_files.",
        "The patch installs, but its report ends early, without the commands that run last.",
        "Add an empty directory updated_files."},
       noUpdatedFiles,
       nullptr},
      {{"command-order", Warning, "The commands of a list are not numbered.",
        "They run in the order of their bytes, not in that of the file.",
        "Begin their names with numbers of equal length."},
       commandOrder,
       nullptr},
      {{"foreign-syntax", Warning, "An entry is written as in another kind of INI file.",
        R"(Comments behind an entry, ";", quotes and "\" at the end of a line are ordinary text here.)",
        "Leave them out; a comment is a line that begins with \"#\"."},
       foreignSyntax,
       nullptr},
      {{"odd-text", Warning, "The descriptor has bytes that text does not have.",
        "A byte-order mark and a carriage return inside a line become part of names and values, and messages "
        "with long lines are cut.",
        "Write patch.ini as plain text with short lines."},
       oddText,
       nullptr},
      {{"odd-name", Warning, "A member's name has a blank, a control character or a \"%\".",
        "Reports and logs cannot be read any more; a line end in a name makes two lines of one.",
        "Use letters, digits and \"/ _ - . +\"."},
       oddName,
       nullptr},
      {{"product-exe-unused", Warning, "productEXE is set.",
        "The installer updates no copies of a product's program.",
        "Leave it out; update copies in a command."},
       productExeUnused,
       nullptr},
      {{"set-id-member", Warning, "A new file has a set-id bit.",
        "A file that is new in the home gets mode 0755.", "Set the mode in a command."},
       setIdMember,
       nullptr},
      {{"foreign-owner", Warning, "A new file does not belong to root.",
        "Installed by root, a file that is new in the home gets the archive's owner, who may be another "
        "person "
        "there.",
        "Build the archive with owner and group 0."},
       foreignOwner,
       nullptr},
      {{"history-columns", Warning, "patchName does not fit the history.",
        "The columns of patches.hist are broken.", "Use at most 20 characters and no \"|\"."},
       historyColumns,
       nullptr},
  };
}

} // namespace

const std::vector<LintRule> &lintRules() {
  static const std::vector<LintRule> rules = [] {
    std::vector<LintRule> all;
    for (const auto &family : {nameRules(), archiveRules(), memberRules(), descriptorRules(), commandRules(),
                               setRules(), warnings()})
      all.insert(all.end(), family.begin(), family.end());
    return all;
  }();
  return rules;
}
