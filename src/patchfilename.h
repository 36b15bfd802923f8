// The name of a patch file: product_platform_target_fixpack.extension, for example
// kxe_lpp266_vema_fp0001.tar.
//
// The name alone decides whether a file is a patch, and for which product, before the archive is opened. A
// malformed name is no error: isValid() is false, and a trace line has the reason.
#pragma once

#include <string>

class PatchFileName {
public:
  /// `name` is the bare name, without a directory. Parts after the first fault stay empty.
  explicit PatchFileName(const std::string &name);
  PatchFileName(const PatchFileName &other) = default; // GCOVR_EXCL_BR_LINE: exceptions alone
  PatchFileName &operator=(const PatchFileName &other) = default;
  virtual ~PatchFileName() = default;

  const std::string &getFullPlatform() const { return fullPlatform_; } ///< "lpp266"
  const std::string &getPlatform() const { return platform_; }         ///< family: "lpp"
  const std::string &getTarget() const { return target_; }             ///< "vema", "vems", ...
  const std::string &getProduct() const { return product_; }           ///< "kxe"
  const std::string &getFixPackName() const { return fixPackName_; }   ///< "fp0001"
  bool isValid() const { return valid_; }

private:
  bool parse(const std::string &name);
  bool parseProduct(const std::string &part);
  bool parsePlatform(const std::string &part);
  bool parseTarget(const std::string &part);
  bool parseFixPack(const std::string &part);

  std::string fullPlatform_;
  std::string platform_;
  std::string target_;
  std::string product_;
  std::string fixPackName_;
  bool valid_ = true;
};
