// Strategy:
// 1. Every row carries a digest, because SQLite notices a damaged page but not a changed byte inside a row. One bad row
//    condemns the file: nearly all of it can be had from the folders again, and the rest is not worth a guess.
// 2. A change is one transaction that is on the disk before the change is published. Opening writes nothing when the
//    tables are there.
#include "platform/registry/RegistryStore.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/registry/RegistryLog.h"
#include "platform/signing/Sha1.h"

namespace platform {
namespace {

constexpr int kVersion = 1;
constexpr std::size_t kManyRegistrations = 500;

constexpr const char* kSchema =
    "BEGIN;"
    "CREATE TABLE entries (kind INTEGER, key TEXT, content BLOB NOT NULL, digest BLOB NOT NULL,"
    " PRIMARY KEY (kind, key)) WITHOUT ROWID;"
    "PRAGMA user_version = 1;"
    "COMMIT;";

// What an entry is about, and what its key and content are. The numbers are on disks.
enum EntryKind : int {
  kRegistration = 1,  // path: an encoded registration
  kContainer = 2,     // name of a container: [identifier, application identifier, application path]
  kAdded = 3,         // path: true
  kRemoved = 4,       // path: a stamp
};

Bytes encoded(const Value& value) {
  Bytes bytes;
  encodeValue(value, bytes);
  return bytes;
}

std::array<std::uint8_t, 20> digestOf(int kind, const std::string& key, std::span<const std::uint8_t> content) {
  Bytes all;
  all.reserve(1 + key.size() + 1 + content.size());
  all.push_back(static_cast<std::uint8_t>(kind));
  all.insert(all.end(), key.begin(), key.end());
  all.push_back(0);
  all.insert(all.end(), content.begin(), content.end());
  return sha1(all);
}

}  // namespace

// A prepared statement: bind in order, step, read columns.
class RegistryStore::Statement {
 public:
  Statement(sqlite3* database, const char* sql) {
    if (sqlite3_prepare_v2(database, sql, -1, &statement_, nullptr) != SQLITE_OK) statement_ = nullptr;
  }
  ~Statement() { sqlite3_finalize(statement_); }
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;

  Statement& bind(int number) {
    sqlite3_bind_int(statement_, ++bound_, number);
    return *this;
  }
  Statement& bind(const std::string& text) {
    sqlite3_bind_text(statement_, ++bound_, text.data(), static_cast<int>(text.size()), SQLITE_STATIC);
    return *this;
  }
  Statement& bind(std::span<const std::uint8_t> bytes) {
    sqlite3_bind_blob(statement_, ++bound_, bytes.data(), static_cast<int>(bytes.size()), SQLITE_STATIC);
    return *this;
  }
  // True when there is a row to read.
  bool next() { return (result_ = sqlite3_step(statement_)) == SQLITE_ROW; }
  // Runs a statement without rows; answers whether it went well, and makes it ready for other values.
  bool run() {
    const bool done = statement_ != nullptr && sqlite3_step(statement_) == SQLITE_DONE;
    sqlite3_reset(statement_);
    bound_ = 0;
    return done;
  }
  // Whether all rows have been read.
  bool finished() const { return result_ == SQLITE_DONE; }

  std::string text(int column) const {
    const auto bytes = blob(column);
    return {bytes.begin(), bytes.end()};
  }
  std::span<const std::uint8_t> blob(int column) const {
    const auto* data = static_cast<const std::uint8_t*>(sqlite3_column_blob(statement_, column));
    return {data, static_cast<std::size_t>(sqlite3_column_bytes(statement_, column))};
  }
  int integer(int column) const { return sqlite3_column_int(statement_, column); }

 private:
  sqlite3_stmt* statement_ = nullptr;
  int bound_ = 0;
  int result_ = SQLITE_ERROR;
};

RegistryStore::RegistryStore(std::string path, StoredRegistry& stored)
    : path_(std::move(path)), database_(nullptr, &sqlite3_close) {
  for (const bool first : {true, false}) {
    stored = {};
    if (open() && load(stored)) return;
    const int code = database_ ? sqlite3_errcode(database_.get()) : SQLITE_CANTOPEN;
    // A disk that is full or cannot be written is no reason to throw the content away.
    const bool damaged = code == SQLITE_OK || code == SQLITE_ROW || code == SQLITE_DONE || code == SQLITE_CORRUPT ||
                         code == SQLITE_NOTADB || code == SQLITE_ERROR;
    stored = {};
    if (!first || !damaged) break;
    registryLog().error("registry database {} is damaged ({}); it is set aside and built anew", path_, lastError());
    setAside();
  }
  registryLog().error("registry database {} cannot be used: {}; registrations will not be remembered", path_,
                      lastError());
  database_.reset();
}

RegistryStore::~RegistryStore() = default;

std::string RegistryStore::lastError() const {
  return database_ ? sqlite3_errmsg(database_.get()) : "it cannot be opened";
}

bool RegistryStore::open() {
  // The content is nobody else's business; the files beside it take over this one's mode.
  const UniqueFd file(::open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
  sqlite3* opened = nullptr;
  const int result = sqlite3_open_v2(path_.c_str(), &opened, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr);
  database_.reset(opened);
  if (result != SQLITE_OK) return false;
  sqlite3_busy_timeout(opened, 1000);
  return execute("PRAGMA journal_mode = WAL") && execute("PRAGMA synchronous = FULL");
}

bool RegistryStore::execute(const char* sql) {
  return sqlite3_exec(database_.get(), sql, nullptr, nullptr, nullptr) == SQLITE_OK;
}

bool RegistryStore::load(StoredRegistry& stored) {
  int version = -1;
  {
    Statement statement(database_.get(), "PRAGMA user_version");
    if (!statement.next()) return false;
    version = statement.integer(0);
  }
  if (version == 0) return execute(kSchema);
  if (version != kVersion) return false;

  Statement entries(database_.get(), "SELECT kind, key, content, digest FROM entries");
  while (entries.next()) {
    const int kind = entries.integer(0);
    const std::string key = entries.text(1);
    const auto content = entries.blob(2);
    const auto digest = entries.blob(3);
    const auto expected = digestOf(kind, key, content);
    if (!std::equal(digest.begin(), digest.end(), expected.begin(), expected.end())) return false;
    if (kind == kRegistration) {
      // Larger than the codec takes back: the bundle is read again, which is no damage.
      if (auto registration = BundleRegistration::decode(key, content)) stored.registrations.emplace(key, registration);
    } else {
      const Value value = decodeValue(content, nullptr);
      if (kind == kContainer) {
        stored.containers.push_back({key, value.at(0).string(), value.at(1).string(), value.at(2).string()});
      }
      if (kind == kAdded) stored.added.insert(key);
      if (kind == kRemoved) stored.removed.emplace(key, stampOfValue(value));
    }
  }
  return entries.finished();
}

void RegistryStore::setAside() {
  database_.reset();
  for (const char* suffix : {"", "-wal", "-shm"}) {
    const std::string file = path_ + suffix;
    const std::string aside = path_ + ".damaged" + suffix;
    if (std::rename(file.c_str(), aside.c_str()) != 0) (void)::unlink(file.c_str());
  }
}

bool RegistryStore::write(const StoreChange& change) {
  if (!database_ || change.empty()) return true;
  if (execute("BEGIN IMMEDIATE") && writeAll(change) && execute("COMMIT")) {
    // A long log would be read whole by the next start.
    if (change.registrations.size() > kManyRegistrations) (void)execute("PRAGMA wal_checkpoint(TRUNCATE)");
    return true;
  }
  registryLog().error("registry database {} cannot be written: {}", path_, lastError());
  (void)execute("ROLLBACK");
  return false;
}

bool RegistryStore::writeAll(const StoreChange& change) {
  Statement insert(database_.get(), "INSERT OR REPLACE INTO entries VALUES (?, ?, ?, ?)");
  Statement erase(database_.get(), "DELETE FROM entries WHERE kind = ? AND key = ?");
  bool well = true;
  const auto put = [&](EntryKind kind, const std::string& key, const Bytes& content) {
    const auto digest = digestOf(kind, key, content);
    well = well && insert.bind(kind).bind(key).bind(content).bind(digest).run();
  };
  const auto forget = [&](EntryKind kind, const std::string& key) { well = well && erase.bind(kind).bind(key).run(); };

  for (const std::string& path : change.gone) forget(kRegistration, path);
  for (const RegistrationPtr& each : change.registrations) put(kRegistration, each->path, each->encode());
  for (const ContainerOwner& each : change.containers) {
    const Array owner{Value(each.identifier), Value(each.applicationIdentifier), Value(each.applicationPath)};
    put(kContainer, each.name, encoded(owner));
  }
  for (const auto& [path, is] : change.added) {
    if (is) {
      put(kAdded, path, encoded(true));
    } else {
      forget(kAdded, path);
    }
  }
  for (const auto& [path, stamp] : change.removed) {
    if (stamp) {
      put(kRemoved, path, encoded(valueOfStamp(*stamp)));
    } else {
      forget(kRemoved, path);
    }
  }
  return well;
}

}  // namespace platform
