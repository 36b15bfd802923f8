// The functions that find each rule, in families of files; the table in rules.cpp pairs them with their
// texts.
#pragma once

struct Subject;
struct PatchSet;
class Finder;

using LintCheck = void(const Subject &subject, Finder &found);
using LintSetCheck = void(const PatchSet &set, Finder &found);

// product.cpp: the name of the file, and the product that it is for
LintCheck nameGrammar;
LintCheck nameProductDiffers;
LintCheck familyNotTaken;
LintCheck supportPatch;
LintCheck vecmProduct;
LintCheck prereqKind;
LintCheck prereqLevel;
LintCheck levelDigits;
LintCheck allIsHidden;
LintCheck productExeUnused;
LintCheck historyColumns;

// archive.cpp: the archive as a whole
LintCheck noDescriptor;
LintCheck descriptorInvalid;
LintCheck incompleteArchive;
LintCheck tarFails;
LintCheck tarTooLoud;
LintCheck checksumDiffers;
LintCheck noChecksum;

// members.cpp
LintCheck linkMember;
LintCheck hardLinkMember;
LintCheck specialMember;
LintCheck unsafeName;
LintCheck longName;
LintCheck updatedFilesNoDirectory;
LintCheck closedDirectory;
LintCheck futureTime;
LintCheck noUpdatedFiles;
LintCheck oddName;
LintCheck setIdMember;
LintCheck foreignOwner;

// descriptor.cpp: its text
LintCheck nulByte;
LintCheck sectionTwice;
LintCheck keyTwice;
LintCheck strayLine;
LintCheck looksLikeSection;
LintCheck foreignSyntax;
LintCheck oddText;

// commands.cpp
LintCheck commandCut;
LintCheck commandNotFound;
LintCheck commandNotExecutable;
LintCheck commandHasBlank;
LintCheck commandTwice;
LintCheck commandOrder;

// set.cpp: the patches of one directory
LintSetCheck sameProductTwice;
LintSetCheck prereqInSameSet;
LintSetCheck companionIsPatch;
