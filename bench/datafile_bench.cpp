// Record files: write, load, look-up by position and inserts, with records of 100 bytes.
//
// What is compared: our records have wide keys that match without regard to case. The peers match
// exactly, which is less work; they convert from and to wide keys as convert.h does. None of them
// is told to bring the data to a disk, since we do not either. Writing replaces the file and gives
// the memory of the records back, as our close does.
#include <koru/datafile.h>

#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <random>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "convert.h"
#include "harness.h"
#include "memorydirectory.h"

#ifdef KORU_BENCH_HAS_LMDB
#include <lmdb.h>
#endif
#ifdef KORU_BENCH_HAS_GDBM
#include <gdbm.h>
#endif
#ifdef KORU_BENCH_HAS_SQLITE
#include <sqlite3.h>
#endif

namespace {

using bench::Peer;
using bench::Work;

/// A record as the peers give and take it.
struct Plain {
    std::wstring key;
    std::vector<unsigned char> data;
};
using Records = std::vector<Plain>;

Records _records(std::string const& prefix, std::size_t count) {
    Records records;
    char key[64];
    for (std::size_t i = 0; i < count; ++i) {
        std::snprintf(key, sizeof key, "%s %06u", prefix.c_str(),
                      static_cast<unsigned>(i * 7919 % 1000003));
        records.push_back(
            {bench::widen(key), std::vector<unsigned char>(100, static_cast<unsigned char>(i))});
    }
    return records;
}

std::vector<Koru::DataFile::Record> _ourRecords(Records const& records) {
    std::vector<Koru::DataFile::Record> ours;
    for (Plain const& record : records) ours.emplace_back(record.key, record.data);
    return ours;
}

// The stores. Each is made for a path. write replaces the file, load reads all of it; begin makes
// ready for inserts on top of the file, and abandon gives them up.

class Ours {
public:
    explicit Ours(std::string const& path) : file_(Koru::File::Path(path)) {}
    ~Ours() { file_.setMode(Koru::File::READ); } // so that nothing is written
    Ours(Ours const&) = delete;
    Ours& operator=(Ours const&) = delete;

    Koru::DataFile& file() { return file_; }
    void load() { file_.open(Koru::File::READ | Koru::File::WRITE); }
    /// An empty file.
    void create() { file_.open(Koru::File::WRITE); }

private:
    Koru::DataFile file_;
};

/// Our format, record by record.
class Stdio {
public:
    static constexpr char const* name = "stdio loop";

    explicit Stdio(std::string const& path) : path_(path) {}

    void write(Records const& records) const {
        ::unlink(path_.c_str());
        std::FILE* const file = std::fopen(path_.c_str(), "wb");
        bench::require(file != nullptr, "stdio: open");
        std::string key;
        for (Plain const& record : records) {
            key.clear();
            for (wchar_t c : record.key) {
                key += '\0';
                key += static_cast<char>(c);
            }
            writePart(file, key.data(), key.size());
            writePart(file, record.data.data(), record.data.size());
        }
        bench::require(std::fclose(file) == 0, "stdio: write");
    }
    void load(Records& records) const {
        std::FILE* const file = std::fopen(path_.c_str(), "rb");
        bench::require(file != nullptr, "stdio: open");
        std::string key;
        for (std::uint32_t size; std::fread(&size, sizeof size, 1, file) == 1;) {
            Plain record;
            key.resize(size);
            readPart(file, &key[0], size);
            for (std::size_t i = 1; i < key.size(); i += 2) record.key += key[i];
            bench::require(std::fread(&size, sizeof size, 1, file) == 1, "stdio: read");
            record.data.resize(size);
            readPart(file, record.data.data(), size);
            records.push_back(std::move(record));
        }
        std::fclose(file);
    }

private:
    static void writePart(std::FILE* file, void const* bytes, std::size_t size) {
        auto const number = static_cast<std::uint32_t>(size);
        std::fwrite(&number, sizeof number, 1, file);
        std::fwrite(bytes, 1, size, file);
    }
    static void readPart(std::FILE* file, void* bytes, std::size_t size) {
        bench::require(std::fread(bytes, 1, size, file) == size, "stdio: read");
    }

    std::string path_;
};

/// Replaces the file of a store with transactions.
template <class Store>
[[maybe_unused]] void _replace(Store& store, std::string const& path, Records const& records) {
    ::unlink(path.c_str());
    store.begin();
    for (Plain const& record : records) store.insert(record);
    store.commit();
}

#ifdef KORU_BENCH_HAS_LMDB
class Lmdb {
public:
    static constexpr char const* name = "LMDB";

    explicit Lmdb(std::string const& path) : path_(path) {}
    Lmdb(Lmdb const&) = delete;
    Lmdb& operator=(Lmdb const&) = delete;
    ~Lmdb() { abandon(); }

    void write(Records const& records) { _replace(*this, path_, records); }
    void load(Records& records) {
        begin(MDB_RDONLY);
        MDB_cursor* cursor;
        check(mdb_cursor_open(transaction_, database_, &cursor));
        MDB_val key;
        MDB_val data;
        while (mdb_cursor_get(cursor, &key, &data, MDB_NEXT) == 0) {
            auto const* const bytes = static_cast<unsigned char const*>(data.mv_data);
            records.push_back({bench::widen({static_cast<char const*>(key.mv_data), key.mv_size}),
                               std::vector<unsigned char>(bytes, bytes + data.mv_size)});
        }
        mdb_cursor_close(cursor);
        abandon();
    }
    void begin(unsigned flags = 0) {
        check(mdb_env_create(&environment_));
        check(mdb_env_set_mapsize(environment_, std::size_t{256} << 20));
        check(mdb_env_open(environment_, path_.c_str(), flags | MDB_NOSUBDIR | MDB_NOSYNC, 0644));
        check(mdb_txn_begin(environment_, nullptr, flags, &transaction_));
        check(mdb_dbi_open(transaction_, nullptr, 0, &database_));
    }
    void insert(Plain const& record) {
        std::string key = bench::narrow(record.key);
        MDB_val keyBytes = {key.size(), &key[0]};
        MDB_val data = {record.data.size(), const_cast<unsigned char*>(record.data.data())};
        check(mdb_put(transaction_, database_, &keyBytes, &data, MDB_NOOVERWRITE));
    }
    void commit() {
        check(mdb_txn_commit(transaction_));
        transaction_ = nullptr;
        mdb_env_close(environment_);
    }
    void abandon() {
        if (transaction_ == nullptr) return;
        mdb_txn_abort(transaction_);
        transaction_ = nullptr;
        mdb_env_close(environment_);
    }

private:
    static void check(int error) { bench::require(error == 0, "LMDB"); }

    std::string path_;
    MDB_env* environment_ = nullptr;
    MDB_txn* transaction_ = nullptr;
    MDB_dbi database_ = 0;
};
#else
struct Lmdb : bench::Missing {
    static constexpr char const* name = "LMDB";
};
#endif

#ifdef KORU_BENCH_HAS_GDBM
/// Has no transactions that inserts could be given up with, so it takes no part in those.
class Gdbm {
public:
    static constexpr char const* name = "GDBM";

    explicit Gdbm(std::string const& path) : path_(path) {}

    void write(Records const& records) const {
        ::unlink(path_.c_str());
        GDBM_FILE const file = open(GDBM_NEWDB);
        for (Plain const& record : records) {
            std::string key = bench::narrow(record.key);
            datum const content = {
                reinterpret_cast<char*>(const_cast<unsigned char*>(record.data.data())),
                static_cast<int>(record.data.size())};
            bench::require(gdbm_store(file, {&key[0], static_cast<int>(key.size())}, content,
                                      GDBM_INSERT) == 0,
                           "GDBM: store");
        }
        gdbm_close(file);
    }
    void load(Records& records) const {
        GDBM_FILE const file = open(GDBM_READER);
        for (datum key = gdbm_firstkey(file); key.dptr != nullptr;) {
            datum const data = gdbm_fetch(file, key);
            auto const* const bytes = reinterpret_cast<unsigned char const*>(data.dptr);
            records.push_back({bench::widen({key.dptr, static_cast<std::size_t>(key.dsize)}),
                               std::vector<unsigned char>(bytes, bytes + data.dsize)});
            std::free(data.dptr);
            datum const next = gdbm_nextkey(file, key);
            std::free(key.dptr);
            key = next;
        }
        gdbm_close(file);
    }

private:
    GDBM_FILE open(int mode) const {
        GDBM_FILE const file = gdbm_open(path_.c_str(), 0, mode | GDBM_NOLOCK, 0644, nullptr);
        bench::require(file != nullptr, "GDBM: open");
        return file;
    }

    std::string path_;
};
#else
struct Gdbm : bench::Missing {
    static constexpr char const* name = "GDBM";
};
#endif

#ifdef KORU_BENCH_HAS_SQLITE
class Sqlite {
public:
    static constexpr char const* name = "SQLite";

    explicit Sqlite(std::string const& path) : path_(path) {}
    Sqlite(Sqlite const&) = delete;
    Sqlite& operator=(Sqlite const&) = delete;
    ~Sqlite() { abandon(); }

    void write(Records const& records) { _replace(*this, path_, records); }
    void load(Records& records) {
        open();
        prepare("SELECT key, data FROM records");
        while (sqlite3_step(statement_) == SQLITE_ROW) {
            auto const* const key = static_cast<char const*>(sqlite3_column_blob(statement_, 0));
            auto const keySize = static_cast<std::size_t>(sqlite3_column_bytes(statement_, 0));
            auto const* const data =
                static_cast<unsigned char const*>(sqlite3_column_blob(statement_, 1));
            records.push_back(
                {bench::widen({key, keySize}),
                 std::vector<unsigned char>(data, data + sqlite3_column_bytes(statement_, 1))});
        }
        close();
    }
    void begin() {
        open();
        run("PRAGMA synchronous=OFF");
        run("BEGIN");
        run("CREATE TABLE IF NOT EXISTS records (key TEXT PRIMARY KEY, data BLOB) WITHOUT ROWID");
        prepare("INSERT OR IGNORE INTO records VALUES (?, ?)");
    }
    void insert(Plain const& record) {
        std::string const key = bench::narrow(record.key);
        sqlite3_bind_text(statement_, 1, key.data(), static_cast<int>(key.size()), SQLITE_STATIC);
        sqlite3_bind_blob(statement_, 2, record.data.data(), static_cast<int>(record.data.size()),
                          SQLITE_STATIC);
        bench::require(sqlite3_step(statement_) == SQLITE_DONE, "SQLite: insert");
        sqlite3_reset(statement_);
    }
    void commit() {
        run("COMMIT");
        close();
    }
    void abandon() {
        if (database_ == nullptr) return;
        run("ROLLBACK");
        close();
    }

private:
    void open() {
        bench::require(sqlite3_open(path_.c_str(), &database_) == SQLITE_OK, "SQLite: open");
    }
    void run(char const* command) {
        bench::require(sqlite3_exec(database_, command, nullptr, nullptr, nullptr) == SQLITE_OK,
                       command);
    }
    void prepare(char const* command) {
        bench::require(
            sqlite3_prepare_v2(database_, command, -1, &statement_, nullptr) == SQLITE_OK, command);
    }
    void close() {
        sqlite3_finalize(statement_);
        sqlite3_close(database_);
        statement_ = nullptr;
        database_ = nullptr;
    }

    std::string path_;
    sqlite3* database_ = nullptr;
    sqlite3_stmt* statement_ = nullptr;
};
#else
struct Sqlite : bench::Missing {
    static constexpr char const* name = "SQLite";
};
#endif

/// A number of records, in a file of our format too.
class Task {
public:
    Task(bench::MemoryDirectory const& directory, std::size_t count)
        : records_(_records("record", count)), path_(directory / "records"),
          bytes_(count * (8 + 2 * records_.front().key.size() + 100)) {
        Stdio(path_).write(records_);
        std::mt19937 random(3);
        for (std::size_t i = 0; i < lookUps; ++i) positions_.push_back(random() % count);
    }

    Records const& records() const { return records_; }
    std::string const& path() const { return path_; }
    /// A file that belongs to one store only.
    std::string path(std::string const& store) const { return path_ + "." + store; }
    std::size_t bytes() const { return bytes_; }
    std::vector<unsigned long> const& positions() const { return positions_; }

    static constexpr std::size_t lookUps = 1000;

private:
    Records records_;
    std::string path_;
    std::size_t bytes_;
    std::vector<unsigned long> positions_;
};

using Slot = std::shared_ptr<std::unique_ptr<Ours>>;

Slot _slot() { return std::make_shared<std::unique_ptr<Ours>>(); }

/// A fresh object in the slot; destroying the last one belongs to the preparation.
Ours& _fresh(Slot const& slot, std::string const& path) {
    slot->reset();
    *slot = std::make_unique<Ours>(path);
    return **slot;
}

Work _ourLoad(Task const& task) {
    Slot const slot = _slot();
    return Work::prepared([slot, path = task.path()] { _fresh(slot, path); },
                          [slot] {
                              (*slot)->load();
                              return (*slot)->file().size();
                          });
}

Work _ourWrite(Task const& task) {
    Slot const slot = _slot();
    return Work::prepared([slot, path = task.path()] { _fresh(slot, path).load(); },
                          [slot] {
                              (*slot)->file().close();
                              return 0;
                          });
}

Work _ourLookUp(Task const& task) {
    Slot const slot = _slot();
    return Work::repeated([slot, &task] {
               Koru::DataFile& file = (*slot)->file();
               for (unsigned long position : task.positions()) bench::keep(file[position]);
               return 0;
           })
        .within([slot, &task] { _fresh(slot, task.path()).load(); }, [slot] { slot->reset(); });
}

/// Inserts on top of the file, or into an empty one.
Work _ourInsert(Task const& task, Records const& added, bool isTop) {
    Slot const slot = _slot();
    return Work::prepared(
        [slot, isTop, empty = task.path("empty"), path = task.path()] {
            if (isTop)
                _fresh(slot, path).load();
            else
                _fresh(slot, empty).create();
        },
        [slot, records = _ourRecords(added)] {
            for (auto const& record : records) (*slot)->file().insert(record);
            return 0;
        });
}

template <class Store>
Work _load(Task const& task) {
    std::string const path = task.path(Store::name);
    Store(path).write(task.records());
    auto const records = std::make_shared<Records>();
    Store(path).load(*records);
    bench::require(records->size() == task.records().size(), Store::name);
    return Work::prepared([records] { Records().swap(*records); },
                          [records, path] {
                              Store(path).load(*records);
                              return 0;
                          });
}

template <class Store>
Work _write(Task const& task) {
    auto const records = std::make_shared<Records>();
    return Work::prepared([records, &task] { *records = task.records(); },
                          [records, path = task.path(Store::name)] {
                              Store(path).write(*records);
                              Records().swap(*records);
                              return 0;
                          });
}

template <class Store>
Work _insertWork(Task const& task, Records const& added, bool isTop) {
    std::string const path = task.path(Store::name);
    ::unlink(path.c_str());
    if (isTop) Store(path).write(task.records());
    auto const store = std::make_shared<std::unique_ptr<Store>>();
    return Work::prepared(
        [store, path] {
            store->reset();
            *store = std::make_unique<Store>(path);
            (*store)->begin();
        },
        [store, added] {
            for (Plain const& record : added) (*store)->insert(record);
            return 0;
        });
}

template <class Store>
Peer _insert(Task const& task, Records const& added, bool isTop) {
    if constexpr (bench::isMissing<Store>) {
        return bench::missing(Store::name);
    } else {
        return bench::peer(Store::name, _insertWork<Store>(task, added, isTop));
    }
}

using Table = std::unordered_map<std::wstring, std::vector<unsigned char>>;

Work _hashMapInsert(Task const& task, Records const& added, bool isTop) {
    auto const table = std::make_shared<Table>();
    auto const base = std::make_shared<Table>();
    if (isTop) {
        for (Plain const& record : task.records()) base->emplace(record.key, record.data);
    }
    return Work::prepared([table, base] { *table = *base; },
                          [table, added] {
                              for (Plain const& record : added) {
                                  table->emplace(record.key, record.data);
                              }
                              return 0;
                          });
}

enum class Step { write, load };

template <class Store>
Peer _peer(Task const& task, Step step) {
    if constexpr (bench::isMissing<Store>) {
        return bench::missing(Store::name);
    } else {
        return bench::peer(Store::name,
                           step == Step::load ? _load<Store>(task) : _write<Store>(task));
    }
}

std::vector<Peer> _stores(Task const& task, Step step) {
    return {_peer<Stdio>(task, step), _peer<Lmdb>(task, step), _peer<Gdbm>(task, step),
            _peer<Sqlite>(task, step)};
}

/// The file's bytes in one go, into memory that is there already.
Work _fread(Task const& task) {
    return Work::repeated([path = task.path(), bytes = std::vector<char>(task.bytes())]() mutable {
        std::FILE* const file = std::fopen(path.c_str(), "rb");
        std::size_t const n = std::fread(bytes.data(), 1, bytes.size(), file);
        std::fclose(file);
        bench::require(n == bytes.size(), "fread");
        return n;
    });
}

/// Replacing the file by bytes that are ready, in one go.
Work _fwrite(Task const& task) {
    return Work::repeated([path = task.path("bytes"), bytes = std::vector<char>(task.bytes())] {
        ::unlink(path.c_str());
        std::FILE* const file = std::fopen(path.c_str(), "wb");
        std::size_t const n = std::fwrite(bytes.data(), 1, bytes.size(), file);
        bench::require(std::fclose(file) == 0 && n == bytes.size(), "fwrite");
        return n;
    });
}

/// Ratios to reach; 0 for none.
struct Goals {
    double write, writeLimit, load, insert;
};

void _inserts(bench::Report& report, Task const& task, std::string const& name, double goal) {
    // Each insert looks through all records, so of many only the last thousand are measured.
    bool const isTop = task.records().size() > 10000;
    std::string const row = name + (isTop ? ", 1,000 more (each)" : ", inserts (each)");
    if (!report.wants(row)) return;
    Records const added = isTop ? _records("another", 1000) : task.records();
    report.compare(row, _ourInsert(task, added, isTop),
                   {_insert<Lmdb>(task, added, isTop), _insert<Sqlite>(task, added, isTop),
                    bench::limit("unordered_map", _hashMapInsert(task, added, isTop))},
                   goal, static_cast<double>(added.size()));
}

void _size(bench::Report& report, bench::MemoryDirectory const& directory, std::size_t count,
           std::string const& name, Goals const& goals) {
    Task const task(directory, count);
    std::string const write = name + ", write";
    if (report.wants(write)) {
        std::vector<Peer> peers = _stores(task, Step::write);
        peers.push_back(bench::limit("fwrite of the same bytes", _fwrite(task), goals.writeLimit));
        report.compare(write, _ourWrite(task), peers, goals.write);
    }
    std::string const load = name + ", load";
    if (report.wants(load)) {
        std::vector<Peer> peers = _stores(task, Step::load);
        peers.push_back(bench::limit("fread of the same bytes", _fread(task)));
        report.compare(load, _ourLoad(task), peers, goals.load);
    }
    _inserts(report, task, name, goals.insert);
}

/// A position among many records costs what one among few does, but for the processor's caches: a
/// walk would take a hundred times as long.
void _positions(bench::Report& report, bench::MemoryDirectory const& directory) {
    std::string const row = "100,000 records, by position";
    if (!report.wants(row)) return;
    Task const many(directory, 100000);
    bench::MemoryDirectory const other;
    Task const few(other, 1000);
    report.compare(row, _ourLookUp(many),
                   {bench::limit("1,000 records, by position", _ourLookUp(few), 3)}, 0,
                   static_cast<double>(Task::lookUps));
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("records", bench::Options(argc, argv));
    bench::MemoryDirectory const directory;
    _size(report, directory, 1000, "1,000 records", {0, 2.0, 1.05, 0});
    _size(report, directory, 10000, "10,000 records", {0.42, 1.7, 1.4, 1.7});
    _size(report, directory, 100000, "100,000 records", {0, 1.9, 1.25, 0});
    _positions(report, directory);
}
