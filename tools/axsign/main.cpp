// axsign: make signing keys, sign bundles and verify them against a device root's trust store.

#include <CLI/CLI.hpp>

#include "tools/axsign/Axsign.h"

int main(int argc, char** argv) {
  CLI::App app{
      "axsign: make an Ed25519 signing key, sign application and plug-in bundles with it, and "
      "verify bundles against the trust store of the device root ($ANNEXA_ROOT, default /)."};
  app.set_version_flag("--version", std::string("axsign ") + AXD_VERSION);
  app.require_subcommand(1);
  bool json = false;
  std::string keyFile;
  std::string trustFile;
  std::vector<std::string> prefixes;
  std::vector<std::string> bundles;

  auto* keygen = app.add_subcommand(
      "keygen", "write a new private key to KEY_FILE (mode 0600, never over an existing file)");
  keygen->add_option("KEY_FILE", keyFile, "where to write the private key (PEM)")->required();
  keygen->add_option("--trust-file", trustFile,
                     "also write the trust-store file of its public key here, for "
                     "<root>/etc/annexa/trust.d/");
  keygen->add_option("--prefix", prefixes,
                     "with --trust-file: the key vouches only for identifiers beginning with "
                     "this (repeatable)");
  keygen->add_flag("--json", json, "print JSON");
  auto* sign = app.add_subcommand(
      "sign", "sign each BUNDLE with the key in KEY_FILE, the bundles inside it first");
  sign->add_option("--key", keyFile, "the private key (PEM)")->required();
  sign->add_option("BUNDLE", bundles, "application or plug-in bundles")->required();
  sign->add_flag("--json", json, "print JSON");
  auto* verify = app.add_subcommand(
      "verify", "verify each BUNDLE; exit status 0 only when every one is signed and trusted");
  verify->add_option("BUNDLE", bundles, "application or plug-in bundles")->required();
  verify->add_flag("--json", json, "print JSON");

  CLI11_PARSE(app, argc, argv);

  Axsign axsign(json);
  if (*keygen) return axsign.keygen(keyFile, trustFile, prefixes);
  if (*sign) return axsign.sign(keyFile, bundles);
  return axsign.verify(bundles);
}
