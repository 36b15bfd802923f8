// A version file: its name on the first line, its content below. Which component the registry makes of it.
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "fuzz.h"
#include "orvcomponentregistry.h"

namespace {

/// A home with nothing but a registry, in a folder of its own that goes with the process.
class Home {
public:
  Home() {
    std::string pattern = (std::filesystem::temp_directory_path() / "orvpatch-fuzz-XXXXXX").string();
    REQUIRE(mkdtemp(pattern.data()) != nullptr);
    path_ = pattern + "/";
    std::filesystem::create_directory(path_ + "registry");
    setenv("QUILLHOME", path_.c_str(), 1);
  }
  Home(const Home &) = delete;
  Home &operator=(const Home &) = delete;
  ~Home() { std::filesystem::remove_all(path_); }

  /// Makes `name` the one version file.
  void setFile(const std::string &name, const std::string &content) {
    if (!current_.empty())
      std::filesystem::remove(current_);
    current_ = path_ + "registry/" + name;
    std::ofstream(current_, std::ios::binary) << content;
  }

private:
  std::string path_;
  std::string current_;
};

/// A file name that the system takes.
std::string fileName(const std::string &text) {
  std::string name = fuzz::upToNul(text).substr(0, 255);
  for (char &c : name)
    if (c == '/')
      c = '_';
  return name.empty() || name == "." || name == ".." ? "xy.ver" : name;
}

struct Expected {
  bool installed = false;
  std::string name, desc, level, arch;
  std::vector<std::string> prereqs;
  ORVComponent::Type type = ORVComponent::TYPE_AGENT;
};

std::string valueOf(const std::string &line) {
  const std::size_t equals = line.find('=');
  return fuzz::trimmed(equals == std::string::npos ? line : line.substr(equals + 1));
}

void readLines(const std::string &content, Expected &expected) {
  for (const std::string &line : fuzz::lines(content)) {
    if (fuzz::startsWith(line, "desc"))
      expected.desc = valueOf(line);
    if (fuzz::startsWith(line, "VRMF"))
      expected.level = valueOf(line);
    if (fuzz::startsWith(line, "preReqALL") && fuzz::contains(line, "=")) {
      const std::vector<std::string> alternatives = fuzz::pieces(valueOf(line), "|");
      expected.prereqs.push_back(alternatives.empty() ? "none" : alternatives.front());
    }
  }
}

ORVComponent::Type typeOf(const std::string &name) {
  const std::string code = name.substr(0, 2);
  if (code == "qa")
    return ORVComponent::TYPE_VEMS;
  if (code == "pt")
    return ORVComponent::TYPE_VEPS;
  if (code == "dk")
    return ORVComponent::TYPE_VEPD;
  if (fuzz::contains(name, "vms.ver"))
    return ORVComponent::TYPE_VEMS;
  if (fuzz::contains(name, "vps.ver"))
    return ORVComponent::TYPE_VEPS;
  if (fuzz::contains(name, "vpd.ver"))
    return ORVComponent::TYPE_VEPD;
  return code == "zt" ? ORVComponent::TYPE_CLI : ORVComponent::TYPE_AGENT;
}

Expected expectedComponent(const std::string &name, const std::string &content) {
  Expected expected;
  const bool endsInVer = name.size() >= 4 && name.compare(name.size() - 4, 4, ".ver") == 0;
  if (!endsInVer || fuzz::contains(name, "vpw.ver"))
    return expected;
  readLines(content, expected);
  expected.installed = !expected.level.empty();
  expected.name = fuzz::productCode(name.substr(0, 2));
  expected.arch = name.size() < 6 ? "" : name.substr(2, name.size() - 6);
  expected.type = typeOf(name);
  return expected;
}

void checkComponent(const ORVComponent &component, const Expected &expected) {
  REQUIRE(component.getName() == expected.name);
  REQUIRE(component.getDescriptiveName() == expected.desc);
  REQUIRE(component.getArch() == expected.arch);
  REQUIRE(component.getType() == expected.type);
  REQUIRE(component.getPrereqs() == expected.prereqs);
  REQUIRE(component.getVersion()->getVersionString() == Version(expected.level).getVersionString());
  REQUIRE(component.getActiveInstances().empty());
}

void checkLookUps(const ORVComponentRegistry &registry, const ORVComponent *component,
                  const Expected &expected) {
  REQUIRE(registry.getInstalledComponent(expected.name, expected.type) == component);
  REQUIRE(registry.getInstalledComponentByArch(expected.name, expected.type, expected.arch) == component);
  const auto otherType =
      expected.type == ORVComponent::TYPE_CLI ? ORVComponent::TYPE_AGENT : ORVComponent::TYPE_CLI;
  REQUIRE(registry.getInstalledComponent(expected.name, otherType) == nullptr);
  REQUIRE(registry.getInstalledComponent(expected.name + "x", expected.type) == nullptr);
  REQUIRE(registry.getInstalledComponentByArch(expected.name, expected.type, expected.arch + "x") == nullptr);
}

} // namespace

void check(const std::string &input) {
  static Home home;
  std::string content = input;
  const std::string name = fileName(fuzz::takeLine(content));
  home.setFile(name, content);
  const Expected expected = expectedComponent(name, content);

  const ORVComponentRegistry registry;
  const std::vector<ORVComponent *> &components = *registry.getInstalledComponents();
  REQUIRE(components.size() == (expected.installed ? 1 : 0));
  if (expected.installed) {
    checkComponent(*components[0], expected);
    checkComponent(ORVComponent(*components[0]), expected);
  }
  checkLookUps(registry, expected.installed ? components[0] : nullptr, expected);
}
