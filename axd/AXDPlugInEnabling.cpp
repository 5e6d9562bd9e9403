// Enabling a plug-in for a host process: its service description and the launcher, and the
// busy check of its running instances.

#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>

#include "Annexa/AXBundle.h"
#include "axd/AXDNames.h"
#include "axd/AXDPlugIn.h"
#include "platform/codesign/DigestCache.h"
#include "platform/launcher/BusyInstances.h"
#include "platform/launcher/ServiceLauncher.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"

namespace {

constexpr std::int64_t kEnableFailed = 4;
constexpr std::int64_t kNotSigned = 11;

bool isTrue(const std::optional<value::Value>& v) {
  if (!v) return false;
  if (auto flag = v->asBool()) return *flag;
  return v->integerValue() == std::optional<std::int64_t>(1);
}

bool isPoint(const std::optional<value::Value>& point, const std::string& name) {
  return point && point->asString() && *point->asString() == name;
}

// The manifest's "ZynService" when it is a dictionary; empty otherwise.
value::Dictionary manifestService(const AXDPlugIn& plugIn) {
  std::optional<value::Value> service = plugIn.infoKey("ZynService");
  const value::Dictionary* entries = service ? service->asDictionary() : nullptr;
  return entries ? *entries : value::Dictionary();
}

// The entries of |overrides| written over |base|. Our dictionaries are immutable values, so a
// merge is a series of copies; the manifests hold a handful of variables.
value::Dictionary overlay(value::Dictionary base, const value::Dictionary& overrides) {
  for (const auto& [key, entry] : overrides) base = base.with(key, entry);
  return base;
}

// Makes the data container and its "tmp" private directories, so that the HOME and TMPDIR the
// plug-in is given exist before it starts. The error when either cannot be made.
std::optional<os::Error> prepareContainer(const std::string& container) {
  for (const std::string& directory : {container, container + "/tmp"}) {
    os::Status made = os::Paths::ensurePrivateDirectory(directory);
    if (!made.ok()) return made.error();
  }
  return std::nullopt;
}

// The error of code 11 for an executable at |path| that is not the file its bundle's signature
// names (logged); nothing when it is.
std::optional<AXError> checkExecutableDigest(const std::string& path,
                                             const std::string& signedDigest,
                                             const std::string& id) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
  os::Result<std::string> digest = fd >= 0 ? codesign::DigestCache::shared().sha256(fd, path)
                                           : os::Result<std::string>(os::Error::fromErrno(path));
  if (fd >= 0) close(fd);
  if (digest.ok() && digest.value() == signedDigest) return std::nullopt;
  os::Log::notice("refusing plug-in %@: its executable %@ is not the one its bundle signed (%@)",
                  {id, path, digest.ok() ? "changed" : digest.error().message});
  return AXMakeErrorWithFormat(kNotSigned,
                               "the executable of plug-in %@ does not match its signature", {id});
}

}  // namespace

std::optional<AXError> AXDPlugIn::checkExecutable(const std::string& path,
                                                  const std::string& signedDigest) const {
  return checkExecutableDigest(path, signedDigest, facts_.identifierText());
}

std::string AXDPlugIn::sandboxProfile() const {
  std::optional<value::Value> point = pluginKey("QSExtensionPointIdentifier");
  if (isPoint(point, AXDNames::kKeyboardServicePoint)) {
    bool network = isTrue(attribute("RequestsOpenAccess")) &&
                   allowedPCXServices().contains(AXDNames::kKeyboardNetworkService);
    return network ? "plugin" : "keyboard";
  }
  if (isPoint(point, AXDNames::kNetworkFilterPoint)) return "network-filter";
  std::optional<value::Dictionary> own = plugInDictionary();
  const value::Value* ownPoint = own ? own->find("QSExtensionPointIdentifier") : nullptr;
  if (ownPoint && isPoint(*ownPoint, AXDNames::kGlancePreviewPoint)) return "glanced";
  return "plugin";
}

std::optional<AXError> AXDPlugIn::enableForPid(pid_t pid) const {
  std::string id = identifier().value_or("(null)");
  std::string version = this->version().value_or("(null)");
  std::string uuidText = uuid() ? uuid()->string() : "(null)";
  value::Dictionary environment;
  if (const auto& container = rgproxy_->dataContainerPath()) {
    if (std::optional<os::Error> unusable = prepareContainer(*container)) {
      os::Log::notice("cannot prepare the data container of plug-in %@(%@) %@: %@",
                      {id, version, uuidText, unusable->message});
      return AXMakeErrorWithFormat(kEnableFailed, "unable to enable plug-in %@(%@) for pid %d",
                                   {id, uuidText, pid});
    }
    environment = environment.with("HOME", value::Value::string(*container))
                      .with("QFFIXED_USER_HOME", value::Value::string(*container))
                      .with("TMPDIR", value::Value::string(*container + "/tmp"));
  } else {
    os::Log::notice("no data container for plug-in %@(%@) %@ at %@",
                    {id, version, uuidText, path()});
  }
  std::string profile = sandboxProfile();
  if (const char* sdk = std::getenv("AXTEST_SDK")) {
    environment = environment.with("AXTEST_SDK", value::Value::string(sdk));
  }
  value::Dictionary service = manifestService(*this);
  if (const value::Value* own = service.find("EnvironmentVariables")) {
    // Anything but a dictionary of variables adds none.
    if (const value::Dictionary* variables = own->asDictionary()) {
      environment = overlay(environment, *variables);
    }
  }
  service = service.with("EnvironmentVariables", value::Value::dictionary(environment))
                .with("_SandboxProfile", value::Value::string(profile))
                .with("_OmitSandboxParameters", value::Value::boolean(true));
  os::Log::notice("assigning plug-in %@(%@) to %s sandbox", {id, version, profile.c_str()});
  value::Dictionary description{{"ZynService", value::Value::dictionary(service)},
                                {"QFBundlePackageType", value::Value::string("ZYN!")}};
  os::Log::notice("enabling pid=%d for plug-in %@(%@) %@ %@", {pid, id, version, uuidText, path()});

  std::optional<std::string> executable;
  if (std::optional<AXFileURL> location = url()) {
    executable = AXBundle::initWithURL(*location)->bundle()->executablePath();
  }
  if (!executable) {
    return AXMakeErrorWithFormat(kEnableFailed, "cannot obtain executable path for plug-in %@(%@)",
                                 {id, uuidText});
  }
  if (const auto& signedDigest = rgproxy_->signature().executableDigest) {
    if (std::optional<AXError> swapped = checkExecutable(*executable, *signedDigest)) {
      return swapped;
    }
    // The launcher starts the file only while it still has this digest.
    service = service.with(launcher::ServiceLauncher::kExecutableDigestKey,
                           value::Value::string(*signedDigest));
    description = description.with("ZynService", value::Value::dictionary(service));
  }
  os::Status added = launcher::ServiceLauncher::addService(
      pid, identifier().value_or(""), this->version().value_or(""), *executable, description);
  if (added.ok()) return std::nullopt;
  os::Log::notice("zyn error %d allowing pid %d to use plug-in %@(%@) %@ at %@",
                  {added.error().errnum, pid, id, version, uuidText, path()});
  os::Log::notice("service launcher: %@", {added.error().message});
  return AXMakeErrorWithFormat(kEnableFailed, "unable to enable plug-in %@(%@) for pid %d",
                               {id, uuidText, pid});
}

std::optional<value::Dictionary> AXDPlugIn::checkBusy() const {
  if (launcher::BusyInstances::find(path()).empty()) return std::nullopt;
  // A plug-in named only by its plug-in identifier is as busy as any other: a hold must not be
  // granted over it.
  std::optional<value::Value> bundleIdentifier = infoKey("QFBundleIdentifier");
  const std::string* text = bundleIdentifier ? bundleIdentifier->asString() : nullptr;
  std::string name = text ? *text : identifier().value_or("");
  return value::Dictionary{{AXDNames::kBusyBundleIdentifierKey, value::Value::string(name)}};
}
