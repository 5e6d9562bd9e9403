#include "platform/registrum/Store.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <ctime>

#include "platform/os/Log.h"
#include "platform/registrum/RecordCodec.h"
#include "platform/registrum/RecordFields.h"
#include "platform/registrum/Schema.h"

namespace registrum {

namespace {

// Plug-in columns 0-6, then the application's columns 7-11 (all NULL without one).
constexpr const char* kPlugInSelect =
    "SELECT p.uuid, p.path, p.registration_date, p.on_system_partition, p.data_container, "
    "p.entitlements, p.info, p.rule_point, p.signature, p.signer, p.signature_note, "
    "p.executable_digest, "
    "a.path, a.bundle_identifier, a.bundle_version, a.localized_name, a.placeholder "
    "FROM plugins p LEFT JOIN applications a ON a.path = p.application_path ";
constexpr int kRulePointColumn = 7;
constexpr int kSignatureColumn = 8;
constexpr int kApplicationColumn = 12;

constexpr const char* kKeySelect = "SELECT uuid, path, data_container FROM plugins ";

constexpr int kLogWarning = 4;

constexpr const char* kApplicationSelect =
    "SELECT path, bundle_identifier, bundle_version, localized_name, placeholder "
    "FROM applications ";

os::Result<std::unique_ptr<Database>> openWithSchema(const std::string& path) {
  os::Result<std::unique_ptr<Database>> db = Database::open(path);
  if (!db.ok()) return db.error();
  os::Status schema = Schema::ensure(*db.value());
  if (!schema.ok()) return schema.error();
  return db;
}

bool sameFile(const std::string& path, const struct stat& seen) {
  struct stat now {};
  return ::stat(path.c_str(), &now) == 0 && now.st_dev == seen.st_dev && now.st_ino == seen.st_ino;
}

// Renames the database at |path|, with its -wal and -shm and |keptWith|, to
// "<name>.damaged-<seconds>" when it is still the file |seen|; another process may have set it
// aside and started afresh already.
os::Status setAside(const std::string& path, const struct stat& seen,
                    const std::vector<std::string>& keptWith, const os::Error& why) {
  if (!sameFile(path, seen)) return os::success();
  std::string suffix = ".damaged-" + std::to_string(std::time(nullptr));
  std::vector<std::string> parts{path, path + "-wal", path + "-shm"};
  parts.insert(parts.end(), keptWith.begin(), keptWith.end());
  std::string kept;
  for (const std::string& part : parts) {
    if (::rename(part.c_str(), (part + suffix).c_str()) == 0) {
      kept += (kept.empty() ? "" : ", ") + part + suffix;
    } else if (errno != ENOENT) {
      return os::Error::fromErrno("cannot set the damaged registry database " + part + " aside");
    }
  }
  os::Log::write(kLogWarning, why.message + "; kept it as " + kept +
                                  " and started an empty registry: install the applications and "
                                  "register the plug-ins again");
  return os::success();
}

// |text|, or nothing (SQL NULL) when it is empty.
std::optional<std::string> optionalText(const std::string& text) {
  return text.empty() ? std::nullopt : std::optional(text);
}

os::Error corrupt(const std::string& what, const os::Error& cause) {
  return os::Error{EIO, "registry database: " + what + ": " + cause.message};
}

}  // namespace

os::Result<std::unique_ptr<Store>> Store::open(const std::string& path,
                                               std::shared_ptr<Sources> sources,
                                               const std::vector<std::string>& keptWith) {
  struct stat seen {};
  bool existed = ::stat(path.c_str(), &seen) == 0;
  os::Result<std::unique_ptr<Database>> db = openWithSchema(path);
  // Keep the file for whoever wants to look at it, but do not stay unable to start over it.
  if (!db.ok() && db.error().errnum == Database::kNotADatabase && existed) {
    os::Status setAsideStatus = setAside(path, seen, keptWith, db.error());
    if (!setAsideStatus.ok()) return setAsideStatus.error();
    db = openWithSchema(path);
  }
  if (!db.ok()) return db.error();
  return std::unique_ptr<Store>(new Store(std::move(db.value()), std::move(sources)));
}

os::Result<std::shared_ptr<const ApplicationRecord>> Store::application(const std::string& path) {
  os::Result<Statement> select = db_->prepare(std::string(kApplicationSelect) + "WHERE path = ?");
  if (!select.ok()) return select.error();
  select.value().bind(1, path);
  os::Result<bool> row = select.value().step();
  if (!row.ok()) return row.error();
  if (!row.value()) return std::shared_ptr<const ApplicationRecord>();
  return applicationRow(select.value(), 0);
}

os::Result<std::shared_ptr<const PlugInRecord>> Store::plugInByUuid(const value::Uuid& uuid) {
  return onePlugIn("p.uuid", uuid.string());
}

os::Result<std::shared_ptr<const PlugInRecord>> Store::plugInByPath(const std::string& path) {
  return onePlugIn("p.path", path);
}

os::Result<PlugInList> Store::plugInsOfApplication(const std::string& path) {
  os::Result<Statement> select =
      db_->prepare(std::string(kPlugInSelect) + "WHERE p.application_path = ? ORDER BY p.path");
  if (!select.ok()) return select.error();
  select.value().bind(1, path);
  return plugInRows(select.value());
}

os::Result<std::vector<std::shared_ptr<const ApplicationRecord>>> Store::applications() {
  os::Result<Statement> select = db_->prepare(std::string(kApplicationSelect) + "ORDER BY path");
  if (!select.ok()) return select.error();
  std::vector<std::shared_ptr<const ApplicationRecord>> applications;
  for (;;) {
    os::Result<bool> row = select.value().step();
    if (!row.ok()) return row.error();
    if (!row.value()) return applications;
    applications.push_back(applicationRow(select.value(), 0));
  }
}

os::Result<PlugInList> Store::plugIns(const Selection& selection) {
  os::Result<Database::Version> version = db_->version();
  if (!version.ok()) return version.error();
  std::uint64_t sdkGeneration = sources_->refresh();
  if (version.value() != snapshot_.version || sdkGeneration != snapshot_.sdkGeneration ||
      snapshot_.lists.size() >= kMaxSnapshotLists) {
    snapshot_ = Snapshot{version.value(), sdkGeneration, {}};
  }
  auto key =
      std::tuple(selection.plugInIdentifier, selection.rulePoint, selection.excludePlaceholders);
  if (auto kept = snapshot_.lists.find(key); kept != snapshot_.lists.end()) return kept->second;
  std::optional<PlugInList> derived = selectKept(selection);
  os::Result<PlugInList> read =
      derived ? os::Result<PlugInList>(std::move(*derived)) : readPlugIns(selection);
  if (read.ok()) snapshot_.lists.emplace(std::move(key), read.value());
  return read;
}

std::optional<PlugInList> Store::selectKept(const Selection& selection) const {
  if (selection.plugInIdentifier) return std::nullopt;
  auto every = snapshot_.lists.find(decltype(snapshot_.lists)::key_type(
      std::nullopt, std::nullopt, selection.excludePlaceholders));
  if (every == snapshot_.lists.end()) return std::nullopt;
  PlugInList selected;
  for (const auto& record : every->second) {
    const std::optional<std::string>& point = record->rulePoint();
    if (!selection.rulePoint || !point || *point == *selection.rulePoint) {
      selected.push_back(record);
    }
  }
  return selected;
}

os::Result<PlugInList> Store::readPlugIns(const Selection& selection) {
  // Only the criteria that are set become terms: SQLite plans a statement before it sees the
  // parameters, so a term like "?1 IS NULL OR ..." would keep it from using the indexes.
  std::string where = "WHERE 1 ";
  if (selection.plugInIdentifier) where += "AND p.plugin_identifier = ?1 ";
  if (selection.rulePoint) where += "AND (p.rule_point = ?2 OR p.rule_point IS NULL) ";
  if (selection.excludePlaceholders) where += "AND (a.placeholder IS NULL OR a.placeholder = 0) ";
  os::Result<Statement> select =
      db_->prepare(std::string(kPlugInSelect) + where + "ORDER BY p.path");
  if (!select.ok()) return select.error();
  if (selection.plugInIdentifier) select.value().bind(1, *selection.plugInIdentifier);
  if (selection.rulePoint) select.value().bind(2, *selection.rulePoint);
  return plugInRows(select.value());
}

os::Status Store::putApplication(const ApplicationRecord::Fields& fields) {
  os::Result<Statement> upsert = db_->prepare(
      "INSERT INTO applications (path, bundle_identifier, bundle_version, localized_name, "
      "placeholder) VALUES (?1, ?2, ?3, ?4, ?5) ON CONFLICT (path) DO UPDATE SET "
      "bundle_identifier = ?2, bundle_version = ?3, localized_name = ?4, placeholder = ?5");
  if (!upsert.ok()) return upsert.error();
  return upsert.value()
      .bind(1, fields.path)
      .bind(2, fields.bundleIdentifier)
      .bind(3, fields.bundleVersion)
      .bind(4, fields.localizedName)
      .bind(5, std::int64_t{fields.placeholder})
      .run();
}

os::Status Store::putPlugIn(const PlugInRecord::Fields& fields) {
  os::Result<Statement> upsert = db_->prepare(
      "INSERT OR REPLACE INTO plugins (uuid, path, application_path, plugin_identifier, "
      "rule_point, registration_date, on_system_partition, data_container, entitlements, info, "
      "signature, signer, signature_note, executable_digest) "
      "VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)");
  if (!upsert.ok()) return upsert.error();
  std::optional<std::string> application;
  if (fields.containingApplication) application = fields.containingApplication->path();
  return upsert.value()
      .bind(1, fields.uuid.string())
      .bind(2, fields.bundlePath)
      .bind(3, application)
      .bind(4, fields.plugInIdentifier)
      .bind(5, RecordFields::rulePoint(fields))
      .bind(6, fields.registrationDate)
      .bind(7, std::int64_t{fields.onSystemPartition})
      .bind(8, fields.dataContainerPath)
      .bind(9, RecordCodec::encodeDictionary(fields.declaredEntitlements))
      .bind(10, RecordCodec::encodeDictionary(fields.infoDictionary))
      .bind(11, std::string(codesign::BundleSignature::stateName(fields.signature.state)))
      .bind(12, optionalText(fields.signature.signer))
      .bind(13, optionalText(fields.signature.note))
      .bind(14, fields.signature.executableDigest)
      .run();
}

os::Result<std::vector<Store::PlugInKey>> Store::damagedPlugIns() {
  os::Result<Statement> select = db_->prepare(std::string(kPlugInSelect) + "ORDER BY p.path");
  if (!select.ok()) return select.error();
  std::uint64_t sdkGeneration = sources_->refresh();
  std::vector<PlugInKey> damaged;
  for (;;) {
    os::Result<bool> row = select.value().step();
    if (!row.ok()) return row.error();
    if (!row.value()) return damaged;
    if (plugInRow(select.value(), sdkGeneration).ok()) continue;
    damaged.push_back(
        PlugInKey{select.value().text(0), select.value().text(1), select.value().optionalText(4)});
  }
}

os::Result<std::optional<Store::PlugInKey>> Store::plugInKeyAtPath(const std::string& path) {
  os::Result<std::vector<PlugInKey>> keys = plugInKeys("path", path);
  if (!keys.ok()) return keys.error();
  if (keys.value().empty()) return std::optional<PlugInKey>();
  return std::optional<PlugInKey>(std::move(keys.value().front()));
}

os::Result<std::vector<Store::PlugInKey>> Store::plugInKeysOfApplication(const std::string& path) {
  return plugInKeys("application_path", path);
}

os::Result<std::vector<std::string>> Store::plugInUuids() {
  os::Result<Statement> select = db_->prepare("SELECT uuid FROM plugins");
  if (!select.ok()) return select.error();
  std::vector<std::string> uuids;
  for (;;) {
    os::Result<bool> row = select.value().step();
    if (!row.ok()) return row.error();
    if (!row.value()) return uuids;
    uuids.push_back(select.value().text(0));
  }
}

os::Status Store::deletePlugInAtPath(const std::string& path) {
  os::Result<Statement> remove = db_->prepare("DELETE FROM plugins WHERE path = ?");
  if (!remove.ok()) return remove.error();
  return remove.value().bind(1, path).run();
}

os::Status Store::deleteApplication(const std::string& path) {
  os::Result<Statement> plugIns = db_->prepare("DELETE FROM plugins WHERE application_path = ?");
  if (!plugIns.ok()) return plugIns.error();
  os::Status removed = plugIns.value().bind(1, path).run();
  if (!removed.ok()) return removed;
  os::Result<Statement> application = db_->prepare("DELETE FROM applications WHERE path = ?");
  if (!application.ok()) return application.error();
  return application.value().bind(1, path).run();
}

os::Status Store::appendChange(ChangeKind kind, const PlugInList& records) {
  os::Result<Statement> insert = db_->prepare("INSERT INTO changes (kind, records) VALUES (?, ?)");
  if (!insert.ok()) return insert.error();
  os::Status inserted = insert.value()
                            .bind(1, static_cast<std::int64_t>(kind))
                            .bind(2, RecordCodec::encodeList(records))
                            .run();
  if (!inserted.ok()) return inserted;
  os::Result<Statement> trim =
      db_->prepare("DELETE FROM changes WHERE sequence <= (SELECT MAX(sequence) FROM changes) - ?");
  if (!trim.ok()) return trim.error();
  return trim.value().bind(1, std::int64_t{Schema::kChangesKept}).run();
}

os::Result<std::int64_t> Store::lastSequence() {
  os::Result<Statement> select = db_->prepare("SELECT IFNULL(MAX(sequence), 0) FROM changes");
  if (!select.ok()) return select.error();
  os::Result<bool> row = select.value().step();
  if (!row.ok()) return row.error();
  return select.value().integer(0);
}

os::Result<std::vector<Store::Change>> Store::changesAfter(std::int64_t sequence, int limit) {
  os::Result<Statement> select = db_->prepare(
      "SELECT sequence, kind, records FROM changes WHERE sequence > ? ORDER BY sequence LIMIT ?");
  if (!select.ok()) return select.error();
  select.value().bind(1, sequence).bind(2, std::int64_t{limit});
  std::vector<Change> changes;
  for (;;) {
    os::Result<bool> row = select.value().step();
    if (!row.ok()) return row.error();
    if (!row.value()) return changes;
    std::span<const std::uint8_t> records = select.value().blob(2);
    changes.push_back(Change{select.value().integer(0),
                             static_cast<ChangeKind>(select.value().integer(1)),
                             {records.begin(), records.end()}});
  }
}

os::Result<std::shared_ptr<const PlugInRecord>> Store::onePlugIn(const std::string& where,
                                                                 const std::string& key) {
  os::Result<Statement> select =
      db_->prepare(std::string(kPlugInSelect) + "WHERE " + where + " = ?");
  if (!select.ok()) return select.error();
  select.value().bind(1, key);
  std::uint64_t sdkGeneration = sources_->refresh();
  os::Result<bool> row = select.value().step();
  if (!row.ok()) return row.error();
  if (!row.value()) return std::shared_ptr<const PlugInRecord>();
  os::Result<std::shared_ptr<const PlugInRecord>> record = plugInRow(select.value(), sdkGeneration);
  if (record.ok()) return record;
  reportDamaged(select.value().text(0), record.error());
  return std::shared_ptr<const PlugInRecord>();
}

os::Result<PlugInList> Store::plugInRows(Statement& statement) {
  std::uint64_t sdkGeneration = sources_->refresh();
  PlugInList plugIns;
  std::shared_ptr<const ApplicationRecord> application;
  for (;;) {
    os::Result<bool> row = statement.step();
    if (!row.ok()) return row.error();
    if (!row.value()) return plugIns;
    os::Result<std::shared_ptr<const PlugInRecord>> record =
        plugInRow(statement, sdkGeneration, &application);
    if (record.ok()) {
      plugIns.push_back(std::move(record.value()));
    } else {
      reportDamaged(statement.text(0), record.error());
    }
  }
}

os::Result<std::vector<Store::PlugInKey>> Store::plugInKeys(const std::string& where,
                                                            const std::string& key) {
  os::Result<Statement> select =
      db_->prepare(std::string(kKeySelect) + "WHERE " + where + " = ? ORDER BY path");
  if (!select.ok()) return select.error();
  select.value().bind(1, key);
  std::vector<PlugInKey> keys;
  for (;;) {
    os::Result<bool> row = select.value().step();
    if (!row.ok()) return row.error();
    if (!row.value()) return keys;
    keys.push_back(
        PlugInKey{select.value().text(0), select.value().text(1), select.value().optionalText(2)});
  }
}

void Store::reportDamaged(const std::string& uuid, const os::Error& error) {
  if (!reportedDamaged_.insert(uuid).second) return;
  os::Log::write(kLogWarning, error.message +
                                  " (left out as damaged; unregister it or register "
                                  "its bundle again)");
}

os::Result<std::shared_ptr<const PlugInRecord>> Store::plugInRow(
    const Statement& row, std::uint64_t sdkGeneration,
    std::shared_ptr<const ApplicationRecord>* previous) {
  PlugInRecord::Fields fields;
  std::string uuid = row.text(0) + " at " + row.text(1);
  std::optional<value::Uuid> parsed = value::Uuid::parse(row.text(0));
  if (!parsed) return os::Error{EIO, "registry database: malformed plug-in UUID " + uuid};
  fields.uuid = *parsed;
  fields.bundlePath = row.text(1);
  fields.registrationDate = row.real(2);
  fields.onSystemPartition = row.integer(3) != 0;
  fields.dataContainerPath = row.optionalText(4);
  value::Dictionary* blobs[] = {&fields.declaredEntitlements, &fields.infoDictionary};
  for (int i = 0; i < 2; ++i) {
    os::Result<value::Dictionary> decoded = RecordCodec::decodeDictionary(row.blob(5 + i));
    if (!decoded.ok()) return corrupt("plug-in " + uuid, decoded.error());
    *blobs[i] = decoded.value();
  }
  value::Dictionary resolved = sources_->sdks().resolve(fields.infoDictionary);
  const value::Value* plugIn = resolved.find("QSExtension");
  if (!plugIn || !plugIn->asDictionary()) {
    return os::Error{EIO, "registry database: plug-in " + uuid + " has no \"QSExtension\""};
  }
  fields.plugInDictionary = *plugIn->asDictionary();
  fields.sdkGeneration = sdkGeneration;
  fields.rulePoint = row.optionalText(kRulePointColumn);
  if (!row.isNull(kApplicationColumn)) {
    fields.containingApplication = applicationRow(row, kApplicationColumn);
    // Rows come by path, so an application's plug-ins share the record read for the first.
    if (previous && *previous && (*previous)->fields() == fields.containingApplication->fields()) {
      fields.containingApplication = *previous;
    } else if (previous) {
      *previous = fields.containingApplication;
    }
  }
  RecordFields::derive(fields);
  judge(row, fields);
  return std::make_shared<const PlugInRecord>(std::move(fields));
}

void Store::judge(const Statement& row, PlugInRecord::Fields& fields) {
  PlugInRecord::Fields::Signature& signature = fields.signature;
  codesign::BundleSignature::Verification verification;
  std::string state = row.text(kSignatureColumn);
  if (state == codesign::BundleSignature::stateName(codesign::BundleSignature::State::Signed)) {
    verification.state = codesign::BundleSignature::State::Signed;
  } else if (state !=
             codesign::BundleSignature::stateName(codesign::BundleSignature::State::Unsigned)) {
    // A state this program does not know counts as what fails closed.
    verification.state = codesign::BundleSignature::State::Tampered;
  }
  verification.signer = row.optionalText(kSignatureColumn + 1).value_or("");
  verification.reason = row.optionalText(kSignatureColumn + 2).value_or("");
  signature.state = verification.state;
  signature.signer = verification.signer;
  signature.note = verification.reason;
  signature.executableDigest = row.optionalText(kSignatureColumn + 3);
  codesign::TrustStore::Judgement judged =
      sources_->trust().store()->judge(verification, fields.plugInIdentifier.value_or(""));
  signature.outcome = judged.outcome;
  if (judged.outcome == codesign::TrustStore::Outcome::Trusted) {
    fields.entitlements = fields.declaredEntitlements;
  } else {
    signature.distrust = judged.reason;
  }
}

std::shared_ptr<const ApplicationRecord> Store::applicationRow(const Statement& row, int first) {
  return std::make_shared<const ApplicationRecord>(ApplicationRecord::Fields{
      .path = row.text(first),
      .bundleIdentifier = row.optionalText(first + 1),
      .bundleVersion = row.optionalText(first + 2),
      .localizedName = row.optionalText(first + 3),
      .placeholder = row.integer(first + 4) != 0,
  });
}

}  // namespace registrum
