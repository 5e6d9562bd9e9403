// axctl: drive the Annexa plug-in daemon from the command line.

#include <CLI/CLI.hpp>
#include <cstdio>
#include <limits>

#include "Annexa/AXProtocol.h"
#include "tools/axctl/Axctl.h"
#include "tools/axctl/NotificationPrinter.h"
#include "tools/axctl/RuleParser.h"
#include "tools/axctl/ServiceTable.h"
#include "tools/axctl/ValueJson.h"

namespace {

std::vector<value::Uuid> parseUuids(const std::vector<std::string>& texts) {
  std::vector<value::Uuid> uuids;
  for (const auto& text : texts) {
    auto uuid = value::Uuid::parse(text);
    if (!uuid) throw CLI::ValidationError("UUID", "not a UUID: " + text);
    uuids.push_back(*uuid);
  }
  return uuids;
}

const std::map<std::string, std::uint64_t> kDiscoveryFlags = {
    {"all-versions", AXProtocol::kDiscoverAllVersions},
    {"all-copies", AXProtocol::kDiscoverAllCopies},
    {"system-only", AXProtocol::kDiscoverSystemOnly},
    {"all", AXProtocol::AXDiscoverAll},
};

template <typename T>
void check(const os::Result<T>& result, const std::string& what) {
  if (!result.ok()) throw CLI::ValidationError(what, result.error().message);
}

// The rule of --rule JSON and the RULE arguments, merged; nothing when neither is given.
std::optional<value::Dictionary> parseRule(const std::optional<std::string>& json,
                                           const std::vector<std::string>& pieces) {
  RuleParser parser;
  if (json) check(parser.addJson(*json), "--rule");
  for (const auto& piece : pieces) check(parser.add(piece), "RULE");
  return parser.rule();
}

std::uint64_t discoveryFlags(std::uint64_t flags, const std::vector<std::string>& names) {
  for (const auto& name : names) flags |= kDiscoveryFlags.at(name);
  return flags;
}

value::Dictionary parseAnnotations(std::optional<std::int64_t> election,
                                   const std::optional<std::string>& extension) {
  value::Dictionary annotations;
  if (election) annotations = annotations.with("election", value::Value::integer(*election));
  if (!extension) return annotations;
  auto dictionary = dictionaryFromJson(*extension);
  check(dictionary, "--extension");
  return annotations.with("extension", value::Value::dictionary(dictionary.value()));
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{
      "axctl: send requests to the Annexa plug-in daemon (axd) and print the replies, or watch "
      "a system-wide notification."};
  app.require_subcommand(1);
  Axctl::Options options;
  app.add_option(
      "-S,--service", options.serviceName,
      "service name of the daemon (default: " + AXDaemonClient::defaultServiceName() + ")");
  app.add_option("--protocol", options.protocolVersion,
                 "protocol version to send (default 3; the daemon serves 2 and 3)");
  app.add_flag("--json", options.json, "print the whole reply as JSON");

  std::vector<std::string> paths;
  std::vector<std::string> uuidTexts;
  std::vector<std::string> rulePieces;
  std::optional<std::string> ruleJson;
  std::vector<std::string> flagNames;
  std::uint64_t flags = 0;
  std::optional<std::int64_t> election;
  std::optional<std::string> extension;
  bool apps = false;
  bool bundles = false;
  std::string notification;
  std::optional<unsigned> count;
  bool noWait = false;

  auto* add = app.add_subcommand("add", "register the plug-in bundles at PATH...");
  add->add_option("paths", paths, "absolute paths of plug-in bundles");
  auto* remove = app.add_subcommand(
      "remove", "unregister the plug-in bundles at PATH... (needs the manager entitlement)");
  remove->add_option("paths", paths, "absolute paths of plug-in bundles");
  auto* bulk = app.add_subcommand("bulk", "send a bulk request (its options are only logged)");
  bulk->add_option("--flags", flags, "bulk options");
  auto* match = app.add_subcommand("match", "discover plug-ins matching a rule");
  match->add_option("rule", rulePieces,
                    "KEY=PATTERN pairs (PATTERN true and false are booleans) or JSON objects "
                    "starting with '{'; merged with --rule");
  match->add_option("--rule", ruleJson, "the match rule as a JSON object");
  match->add_option(
      "--flags", flags,
      "discovery flags (0x1 all versions, 0x4 all copies, 0x8 system only, 0x200 all)");
  match->add_option("--flag", flagNames, "a discovery flag by name, ORed into --flags")
      ->check(CLI::IsMember(kDiscoveryFlags))
      ->allow_extra_args(false);
  auto* ready = app.add_subcommand("ready", "make plug-ins launchable for this process");
  ready->add_option("uuids", uuidTexts, "plug-in UUIDs")->required();
  ready->add_option("--flags", flags, "ready flags");
  auto* access = app.add_subcommand("access", "get read-extension tokens for plug-in bundles");
  access->add_option("uuids", uuidTexts, "plug-in UUIDs")->required();
  access->add_option("--flags", flags, "access flags");
  auto* annotate = app.add_subcommand("annotate", "record the user's election of plug-ins");
  annotate->add_option("uuids", uuidTexts, "plug-in UUIDs")->required();
  annotate->add_option("--election", election, "the election to store");
  annotate->add_option("--extension", extension,
                       "the annotation's \"extension\" dictionary, as a JSON object");
  auto* hold = app.add_subcommand(
      "hold",
      "hold plug-ins out of use: prints the hold's token and keeps the hold until SIGINT or "
      "SIGTERM (the daemon releases it when axctl ends)");
  hold->add_option("paths", paths, "application or plug-in bundle paths")->required();
  auto* holdKind = hold->add_option_group("kind");
  holdKind->add_flag("--apps", apps,
                     "each path is an application: hold all its plug-ins (flags 1)");
  holdKind->add_flag("--bundles", bundles, "each path is one plug-in bundle (flags 2)");
  holdKind->add_option("--flags", flags, "raw hold flags");
  holdKind->require_option(1);
  auto* release = app.add_subcommand("release", "release the hold with token UUID");
  release->add_option("uuids", uuidTexts, "the hold's token")->required()->expected(1);
  auto* launch = app.add_subcommand(
      "launch",
      "start plug-in UUID in this process (discovery, ready, start), print its pid and wait "
      "for it");
  launch->add_option("uuid", uuidTexts, "the plug-in's UUID")->required()->expected(1);
  launch->add_flag("--no-wait", noWait, "exit with status 0 once the plug-in is started");
  auto* services = app.add_subcommand(
      "services",
      "print the service launcher's table: which process may start which plug-in; no daemon "
      "needed");
  auto* watch = app.add_subcommand(
      "watch",
      "print a line (NAME and local time) per post of notification NAME; no daemon needed");
  watch->add_option("name", notification, "e.g. " AXD_VENDOR_PREFIX ".annexa.annotation-change")
      ->required();
  watch->add_option("--count", count, "exit after N posts (default: run until SIGINT or SIGTERM)")
      ->check(CLI::Range(1u, std::numeric_limits<unsigned>::max()));

  CLI11_PARSE(app, argc, argv);
  if (*watch) return NotificationPrinter::watch(notification, count);
  if (*services) return ServiceTable::print(options.json);

  try {
    // Before the client connects: a malformed UUID reaches no daemon.
    const std::vector<value::Uuid> uuids = parseUuids(uuidTexts);
    // A hold lives as long as its client: blocked before the client's threads start, the
    // signals that end the hold reach only the wait in Axctl::hold.
    if (*hold) Axctl::blockEndingSignals();
    Axctl axctl(options);
    if (*add) return axctl.add(paths);
    if (*remove) return axctl.remove(paths);
    if (*bulk) return axctl.bulk(flags);
    if (*match) {
      return axctl.match(parseRule(ruleJson, rulePieces), discoveryFlags(flags, flagNames));
    }
    if (*ready) return axctl.ready(uuids, flags);
    if (*access) return axctl.access(uuids, flags);
    if (*annotate) {
      return axctl.annotate(uuids, parseAnnotations(election, extension));
    }
    if (*hold) {
      if (apps) flags = AXProtocol::kHoldApplications;
      if (bundles) flags = AXProtocol::kHoldPlugIns;
      return axctl.hold(paths, flags);
    }
    if (*launch) return axctl.launch(uuids.front(), !noWait);
    return axctl.release(uuids.front());
  } catch (const CLI::Error& e) {
    return app.exit(e);
  }
}
