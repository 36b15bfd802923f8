#include "transaction/record.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include <fcntl.h>
#include <nlohmann/json.hpp>
#include <sys/stat.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "inputfile.h"
#include "judgement.h"
#include "look.h"
#include "text.h"

using Json = nlohmann::ordered_json;

namespace {

/// 50,000 files with some 400 bytes each take 20 MiB.
constexpr std::size_t LargestRecord = 512UL * 1024 * 1024;

constexpr std::array<const char *, 4> phaseNames = {"prepared", "installing", "installed", "closed"};

Json stateJson(const std::optional<FileState> &state) {
  if (!state)
    return nullptr;
  return {{"type", state->type},
          {"mode", octalMode(state->mode)},
          {"user", state->user},
          {"group", state->group},
          {"size", state->size},
          {"seconds", state->seconds},
          {"nanoseconds", state->nanoseconds},
          {"device", state->device},
          {"inode", state->inode}};
}

std::optional<FileState> stateFrom(const Json &json) {
  if (json.is_null())
    return std::nullopt;
  FileState state;
  state.type = json.at("type");
  state.mode = static_cast<unsigned>(std::stoul(json.at("mode").get<std::string>(), nullptr, 8));
  state.user = json.at("user");
  state.group = json.at("group");
  state.size = json.at("size");
  state.seconds = json.at("seconds");
  state.nanoseconds = json.at("nanoseconds");
  state.device = json.at("device");
  state.inode = json.at("inode");
  return state;
}

std::string bytesAt(const Json &json, const char *key) {
  return bytesOfJsonText(json.at(key).get<std::string>());
}

Json patchesJson(const Record &record) {
  Json list = Json::array();
  for (const RecordedPatch &patch : record.patches)
    list.push_back({{"file", jsonText(patch.file)},
                    {"sha256", patch.sha256},
                    {"product", jsonText(patch.product)},
                    {"target", patch.target},
                    {"name", jsonText(patch.name)},
                    {"levelBefore", jsonText(patch.levelBefore)},
                    {"levelAfter", jsonText(patch.levelAfter)},
                    {"result", patch.result},
                    {"versionFile", jsonText(patch.versionFile)}});
  return list;
}

Json instancesJson(const std::vector<RecordedInstance> &instances) {
  Json list = Json::array();
  for (const RecordedInstance &instance : instances)
    list.push_back({{"product", jsonText(instance.product)},
                    {"name", jsonText(instance.name)},
                    {"pid", jsonText(instance.pid)},
                    {"user", jsonText(instance.user)}});
  return list;
}

std::vector<RecordedInstance> instancesFrom(const Json &json) {
  std::vector<RecordedInstance> instances;
  for (const Json &one : json)
    instances.push_back(
        {bytesAt(one, "product"), bytesAt(one, "name"), bytesAt(one, "pid"), bytesAt(one, "user")});
  return instances;
}

Json filesJson(const Record &record) {
  Json list = Json::array();
  for (const TouchedFile &file : record.files)
    list.push_back({{"path", jsonText(file.path)},
                    {"change", file.before ? "replaced" : "new"},
                    {"saved", file.saved},
                    {"before", stateJson(file.before)},
                    {"after", stateJson(file.after)}});
  return list;
}

Json rewrittenJson(const Record &record) {
  Json list = Json::array();
  for (const RewrittenFile &file : record.rewritten)
    list.push_back({{"path", jsonText(file.path)},
                    {"saved", file.saved},
                    {"evidence", file.isEvidence},
                    {"before", stateJson(file.before)}});
  return list;
}

Json textsJson(const std::vector<std::string> &texts) {
  Json list = Json::array();
  for (const std::string &text : texts)
    list.push_back(jsonText(text));
  return list;
}

std::vector<std::string> textsFrom(const Json &json) {
  std::vector<std::string> texts;
  for (const Json &text : json)
    texts.push_back(bytesOfJsonText(text.get<std::string>()));
  return texts;
}

Json stepsJson(const Record &record) {
  Json list = Json::array();
  for (const RecordedStep &step : record.steps)
    list.push_back({{"step", step.step}, {"seconds", step.seconds}, {"result", jsonText(step.result)}});
  return list;
}

Json directoriesJson(const Record &record) {
  Json list = Json::array();
  for (const NewDirectory &directory : record.directories)
    list.push_back(jsonText(directory.path));
  return list;
}

void readLists(const Json &json, Record &record) {
  for (const Json &one : json.at("patches"))
    record.patches.push_back({bytesAt(one, "file"), one.at("sha256"), bytesAt(one, "product"),
                              one.at("target"), bytesAt(one, "name"), bytesAt(one, "levelBefore"),
                              bytesAt(one, "levelAfter"), one.at("result"), bytesAt(one, "versionFile")});
  for (const Json &one : json.at("files"))
    record.files.push_back(
        {bytesAt(one, "path"), stateFrom(one.at("before")), stateFrom(one.at("after")), one.at("saved")});
  for (const Json &one : json.at("rewritten"))
    record.rewritten.push_back(
        {bytesAt(one, "path"), stateFrom(one.at("before")), one.at("saved"), one.at("evidence")});
  for (const std::string &path : textsFrom(json.at("directories")))
    record.directories.push_back({path});
  for (const Json &one : json.at("steps"))
    record.steps.push_back({one.at("step"), one.at("seconds"), bytesAt(one, "result")});
  for (const Json &one : json.at("differences"))
    record.differences.push_back({bytesAt(one, "path"), one.at("kind"), bytesAt(one, "text")});
  for (const Json &one : json.at("findings"))
    record.findings.push_back(
        {one.at("rule"), one.at("severity") == "error" ? Severity::Error : Severity::Warning,
         bytesAt(one, "patch"), bytesAt(one, "where"), bytesAt(one, "text"), bytesAt(one, "remedy")});
}

Record recordFrom(const Json &json) {
  Record record;
  record.id = json.at("id");
  record.action = json.at("action");
  record.undoes = json.at("undoes").is_null() ? "" : json.at("undoes").get<std::string>();
  record.home = bytesAt(json, "home");
  record.user = bytesAt(json, "user");
  record.started = json.at("started");
  record.ended = json.at("ended").is_null() ? "" : json.at("ended").get<std::string>();
  for (std::size_t i = 0; i < phaseNames.size(); ++i)
    if (json.at("phase") == phaseNames[i])
      record.phase = static_cast<Phase>(i);
  readLists(json, record);
  record.temporary = textsFrom(json.at("temporary"));
  record.setAside = textsFrom(json.at("setAside"));
  record.dependents = textsFrom(json.at("dependents"));
  record.otherChanges = textsFrom(json.at("otherChanges"));
  record.before = instancesFrom(json.at("instances").at("before"));
  record.after = instancesFrom(json.at("instances").at("after"));
  const Json &installer = json.at("installer");
  if (!installer.is_null())
    record.installer = {installer.at("status"), bytesAt(installer, "stdout"), bytesAt(installer, "stderr")};
  record.messages = textsFrom(json.at("messages"));
  record.verdict = json.at("verdict").is_null() ? "" : json.at("verdict").get<std::string>();
  record.dryRun = json.at("dryRun");
  return record;
}

Json textOrNull(const std::string &text) {
  return text.empty() ? Json(nullptr) : Json(text);
}

[[noreturn]] void cannotWrite(const std::string &path, int error) {
  throw JudgementError("cannot write " + path + ": " + strerror(error));
}

} // namespace

std::string nameOf(const RecordedInstance &instance) {
  return instance.product + (instance.name.empty() ? "" : " " + instance.name);
}

bool isAmong(const std::vector<RecordedInstance> &list, const RecordedInstance &instance) {
  return std::any_of(list.begin(), list.end(), [&instance](const RecordedInstance &other) {
    return other.product == instance.product && other.name == instance.name;
  });
}

std::optional<FileState> stateOf(const std::string &path) {
  const std::optional<struct stat> status = lookAt(path);
  if (!status)
    return std::nullopt;
  return FileState{status->st_mode & S_IFMT, status->st_mode & 07777U, status->st_uid,
                   status->st_gid,           status->st_size,          status->st_mtim.tv_sec,
                   status->st_mtim.tv_nsec,  status->st_dev,           status->st_ino};
}

bool isSameInode(const FileState &a, const FileState &b) {
  return a.inode == b.inode && a.type == b.type;
}

bool isSameFile(const FileState &a, const FileState &b) {
  return isSameInode(a, b) && a.size == b.size && a.seconds == b.seconds && a.nanoseconds == b.nanoseconds;
}

Json toJson(const Record &record) {
  Verification verification;
  verification.differences = record.differences;
  return {{"id", record.id},
          {"action", record.action},
          {"undoes", textOrNull(record.undoes)},
          {"home", jsonText(record.home)},
          {"user", jsonText(record.user)},
          {"started", record.started},
          {"ended", textOrNull(record.ended)},
          {"verdict", textOrNull(record.verdict)},
          {"phase", phaseNames[static_cast<std::size_t>(record.phase)]},
          {"dryRun", record.dryRun},
          {"patches", patchesJson(record)},
          {"findings", toJson(record.findings).at("findings")},
          {"steps", stepsJson(record)},
          {"files", filesJson(record)},
          {"rewritten", rewrittenJson(record)},
          {"directories", directoriesJson(record)},
          {"temporary", textsJson(record.temporary)},
          {"setAside", textsJson(record.setAside)},
          {"dependents", textsJson(record.dependents)},
          {"otherChanges", textsJson(record.otherChanges)},
          {"instances", {{"before", instancesJson(record.before)}, {"after", instancesJson(record.after)}}},
          {"installer",
           {{"status", record.installer.status},
            {"stdout", jsonText(record.installer.out)},
            {"stderr", jsonText(record.installer.err)}}},
          {"differences", toJson(verification).at("differences")},
          {"messages", textsJson(record.messages)}};
}

Record parseRecord(const std::string &text) {
  try {
    return recordFrom(Json::parse(text));
  } catch (const nlohmann::json::exception &error) {
    throw JudgementError(std::string("no record of a transaction: ") + error.what());
  } catch (const std::logic_error &error) { // a mode that is no number
    throw JudgementError(std::string("no record of a transaction: ") + error.what());
  }
}

int replaceFile(const std::string &path, const std::string &content) {
  const std::string fresh = path + ".new";
  static_cast<void>(unlink(fresh.c_str())); // one that was cut off may be in the way
  FileDescriptor file(open(fresh.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  const bool isReplaced = file.isOpen() && file.write(content) && fsync(file.get()) == 0 && file.close() &&
                          rename(fresh.c_str(), path.c_str()) == 0;
  return isReplaced ? 0 : errno;
}

void writeRecord(const std::string &folder, const Record &record) {
  const std::string path = folder + "/record.json";
  if (const int error = replaceFile(path, toJson(record).dump(1) + "\n"))
    cannotWrite(path, error);
  const FileDescriptor directory(folder.c_str(), O_RDONLY | O_DIRECTORY);
  if (!directory.isOpen() || fsync(directory.get()) != 0)
    cannotWrite(folder, errno);
}

Record readRecord(const std::string &folder) {
  const InputFile file(folder + "/record.json");
  if (!file.exists())
    throw JudgementError("no record in " + folder);
  const std::string text = file.content(LargestRecord);
  try {
    return parseRecord(text);
  } catch (const JudgementError &error) {
    throw JudgementError(folder + "/record.json: " + error.what());
  }
}
