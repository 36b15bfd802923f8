#include "orvcomponentregistry.h"

#include <cstdlib>
#include <cstring>

#include "file.h"
#include "logger.h"
#include "target.h"
#include "utilities.h"

#define LOG_COMPONENT "orvcomponentregistry"

ORVComponentRegistry *ORVComponentRegistry::_inst = nullptr;

namespace {

bool contains(const std::string &text, const char *piece) {
  return text.find(piece) != std::string::npos;
}

bool beginsWith(const std::string &text, const char *prefix) {
  return text.rfind(prefix, 0) == 0;
}

/// The content of a version file.
struct VersionFile {
  std::string desc;
  std::string vrmf;
  std::vector<std::string> prereqs;
};

/// The text after the first "=", trimmed; the whole line, trimmed, when it has none.
std::string valueOf(const std::string &line) {
  std::string value = line.substr(line.find('=') + 1);
  Util::trimString(value);
  return value;
}

void addPrereq(const std::string &line, std::vector<std::string> &prereqs) {
  if (!contains(line, "="))
    return;
  const std::string value = valueOf(line);
  const std::vector<std::string> pieces = Util::tokenizeString(value, "|");
  if (value == "none") {
    LOG_TRACE("Added preReqALL value = none");
    prereqs.emplace_back("none");
  } else if (pieces.empty()) {
    LOG_TRACE("preReqALL syntax unknown: Defaulting preReqALL value = none");
    prereqs.emplace_back("none");
  } else {
    // KEEP(prereq-first-piece): of several alternatives only the first is kept.
    LOG_TRACE("Added preReqALL value = %s", pieces.front().c_str());
    prereqs.push_back(pieces.front());
  }
}

VersionFile parseVersionFile(const std::vector<std::string> &lines) {
  VersionFile content;
  for (const std::string &line : lines) {
    // KEEP(key-prefix): a key is compared with the beginning of the line, so "description" counts as "desc".
    if (beginsWith(line, "desc"))
      content.desc = valueOf(line);
    else if (beginsWith(line, "VRMF"))
      content.vrmf = valueOf(line);
    else if (beginsWith(line, "preReqALL"))
      addPrereq(line, content.prereqs);
  }
  return content;
}

/// Between the product code and the extension; empty without one.
std::string archOf(const std::string &fileName) {
  const std::size_t point = fileName.rfind('.');
  if (point == std::string::npos || point < 2)
    return "";
  return fileName.substr(2, point - 2);
}

bool isVersionFile(const std::string &fileName) {
  static const char extension[] = ".ver";
  const std::size_t last = fileName.rfind(extension);
  return last != std::string::npos && last + strlen(extension) == fileName.size() &&
         !contains(fileName, "vpw.ver");
}

} // namespace

ORVComponentRegistry *ORVComponentRegistry::getInstance() {
  if (_inst == nullptr)
    _inst = new ORVComponentRegistry();
  return _inst;
}

ORVComponentRegistry::ORVComponentRegistry() {
  LOG_TRACE("ORVComponentRegistry::ORVComponentRegistry %s", "entry");
  home_ = Util::getQuillHome();
  buildComponents();
  LOG_TRACE("ORVComponentRegistry::ORVComponentRegistry %s", "exit");
}

ORVComponentRegistry::~ORVComponentRegistry() {
  LOG_TRACE("ORVComponentRegistry::~ORVComponentRegistry %s", "entry");
  if (_inst == this)
    _inst = nullptr;
}

std::string getCInfo_Running(std::string home) {
  LOG_TRACE("ORVComponentRegistry::getCInfo_Running %s", "entry");
  std::string text;
  char *content = nullptr;
  if (Util::readFile((home + "config/.ConfigData/RunInfo").c_str(), &content) == 0)
    text = content;
  else
    LOG_TRACE("unable to read RunInfo file");
  free(content);
  // KEEP(cinfo-exit-name): the exit line names the operation without its suffix.
  LOG_TRACE("ORVComponentRegistry::getCInfo %s", "exit");
  return text;
}

void ORVComponentRegistry::buildComponents() {
  LOG_TRACE("ORVComponentRegistry::buildComponents %s", "entry");
  const std::string cinfo = getCInfo_Running(home_);
  File registry(home_ + "registry");
  for (const File *file : *registry.listFiles())
    if (isVersionFile(file->getName()))
      buildComponent(file->getPath(), cinfo);
  LOG_TRACE("ORVComponentRegistry::buildComponents %s", "exit");
}

void ORVComponentRegistry::buildComponent(const std::string &path, const std::string &cinfo) {
  LOG_TRACE("ORVComponentRegistry::buildComponent(%s) %s", path.c_str(), "entry");
  const std::string fileName = path.substr(path.rfind('/') + 1);
  std::vector<std::string> lines;
  const int error = Util::readFileByLines(path.c_str(), lines);
  if (error != 0) {
    LOG_TRACE("Could not read %s: %s", path.c_str(), strerror(error));
    return;
  }
  const VersionFile content = parseVersionFile(lines);
  const std::string code = fileName.substr(0, 2);
  const std::string arch = archOf(fileName);
  std::unique_ptr<ORVComponent> component;
  if (code == "qa")
    component = std::make_unique<UNIXMonitoringServer>(home_, code, content.desc, content.vrmf, arch,
                                                       content.prereqs, cinfo);
  else
    component = std::make_unique<ORVComponent>(home_, code, content.desc, content.vrmf, arch, content.prereqs,
                                               versionFileKind(path), cinfo);
  if (!content.vrmf.empty())
    components_.append(std::move(component));
  LOG_TRACE("ORVComponentRegistry::buildComponent %s", "exit");
}

ORVComponent *ORVComponentRegistry::getInstalledComponent(const std::string &name,
                                                          ORVComponent::Type type) const {
  LOG_TRACE("ORVComponentRegistry::getInstalledComponent %s", "entry");
  ORVComponent *const found = findFirst([&](const ORVComponent &component) {
    return component.getType() == type && component.getName() == name;
  });
  LOG_TRACE("ORVComponentRegistry::getInstalledComponent %s", "exit");
  return found;
}

ORVComponent *ORVComponentRegistry::getInstalledComponentByArch(const std::string &name,
                                                                ORVComponent::Type type,
                                                                const std::string &arch) const {
  LOG_TRACE("ORVComponentRegistry::getInstalledComponentByArch %s", "entry");
  ORVComponent *const found = findFirst([&](const ORVComponent &component) {
    return component.getType() == type && component.getName() == name && component.getArch() == arch;
  });
  LOG_TRACE("ORVComponentRegistry::getInstalledComponentByArch %s", "exit");
  return found;
}

ORVComponent *ORVComponentRegistry::findFirst(
    const std::function<bool(const ORVComponent &)> &matches) const {
  for (ORVComponent *component : *components_.items())
    if (matches(*component))
      return component;
  return nullptr;
}

ORVComponent *getComponent(const std::string &code) {
  ORVComponent::Type type = ORVComponent::TYPE_AGENT;
  if (code == "kqa")
    type = ORVComponent::TYPE_VEMS;
  else if (code == "kpt")
    type = ORVComponent::TYPE_VEPS;
  return ORVComponentRegistry::getInstance()->getInstalledComponent(code, type);
}
