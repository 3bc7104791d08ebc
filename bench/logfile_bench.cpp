// Log files: lines of 100 bytes through the inserters.
//
// Each series begins with an empty file. Unless a row says that lines are flushed, they go through
// the buffer that each has by itself. fprintf and spdlog format text where streams insert pieces.
#include <koru/datetime.h>
#include <koru/logfile.h>
#include <koru/string.h>

#include <stdlib.h>
#include <time.h>

#include <cstddef>
#include <cstdio>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "convert.h"
#include "harness.h"
#include "memorydirectory.h"

#ifdef KORU_BENCH_HAS_SPDLOG
#include <spdlog/logger.h>
#include <spdlog/sinks/basic_file_sink.h>
#endif

namespace {

using bench::Work;

/// What makes a line: 99 bytes and the line's end.
struct Pieces {
    std::string level = "warning: ";
    std::string component = "connection pool: ";
    std::string text = "no answer from the server, trying again in five seconds (attempt 3 of 10)";
    std::wstring wideComponent{component.begin(), component.end()};
    /// After a time stamp and a blank, which are twenty bytes.
    std::string shortText = "no answer, trying again in five seconds (fourth time)";
    std::wstring wideShortText{shortText.begin(), shortText.end()};
};

/// YYYY-MM-DD HH:MM:SS, local time, as the C library has it.
struct Stamp {
    Stamp() {
        time_t const now = ::time(nullptr);
        tm parts;
        ::localtime_r(&now, &parts);
        std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &parts);
    }
    char text[20];
};

enum class Line { narrow, flushed, stamped };

// The stores. Each is made for a path, empties the file, and writes lines.

class Ours {
public:
    explicit Ours(std::string const& path) : log_(Koru::File::Path(path)) {
        log_.open(static_cast<unsigned int>(Koru::File::WRITE));
    }
    void narrow(Pieces const& pieces) {
        using Koru::operator<<;
        log_ << pieces.level << pieces.component << pieces.text << '\n';
    }
    void flushed(Pieces const& pieces) {
        narrow(pieces);
        log_.flush();
    }
    void stamped(Pieces const& pieces) {
        using Koru::operator<<;
        log_ << Koru::DateTime(::time(nullptr)) << ' ' << pieces.level << pieces.wideComponent
             << pieces.wideShortText << '\n';
    }

private:
    Koru::LogFile log_;
};

class Ofstream {
public:
    explicit Ofstream(std::string const& path) : log_(path) {}
    void narrow(Pieces const& pieces) {
        log_ << pieces.level << pieces.component << pieces.text << '\n';
    }
    void flushed(Pieces const& pieces) {
        narrow(pieces);
        log_.flush();
    }
    void stamped(Pieces const& pieces) {
        log_ << Stamp().text << ' ' << pieces.level << bench::narrow(pieces.wideComponent)
             << bench::narrow(pieces.wideShortText) << '\n';
    }

private:
    std::ofstream log_;
};

class Fprintf {
public:
    explicit Fprintf(std::string const& path) : log_(std::fopen(path.c_str(), "w")) {
        bench::require(log_ != nullptr, "cannot open a log");
    }
    Fprintf(Fprintf const&) = delete;
    Fprintf& operator=(Fprintf const&) = delete;
    ~Fprintf() { std::fclose(log_); }
    void narrow(Pieces const& pieces) {
        std::fprintf(log_, "%s%s%s\n", pieces.level.c_str(), pieces.component.c_str(),
                     pieces.text.c_str());
    }
    void flushed(Pieces const& pieces) {
        narrow(pieces);
        std::fflush(log_);
    }
    void stamped(Pieces const& pieces) {
        std::fprintf(log_, "%s %s%s%s\n", Stamp().text, pieces.level.c_str(),
                     bench::narrow(pieces.wideComponent).c_str(),
                     bench::narrow(pieces.wideShortText).c_str());
    }

private:
    std::FILE* log_;
};

#ifdef KORU_BENCH_HAS_SPDLOG
/// One that is used by one thread, as the others are.
class Spdlog {
public:
    static constexpr char const* name = "spdlog";

    explicit Spdlog(std::string const& path)
        : log_("", std::make_shared<spdlog::sinks::basic_file_sink_st>(path, true)) {
        log_.set_pattern("%v");
    }
    void narrow(Pieces const& pieces) {
        log_.warn("{}{}{}", pieces.level, pieces.component, pieces.text);
    }
    void flushed(Pieces const& pieces) {
        narrow(pieces);
        log_.flush();
    }
    void stamped(Pieces const& pieces) {
        if (!stamps_) log_.set_pattern("%Y-%m-%d %H:%M:%S %v");
        stamps_ = true;
        log_.warn("{}{}{}", pieces.level, bench::narrow(pieces.wideComponent),
                  bench::narrow(pieces.wideShortText));
    }

private:
    spdlog::logger log_;
    bool stamps_ = false;
};
#else
struct Spdlog : bench::Missing {
    static constexpr char const* name = "spdlog";
};
#endif

template <class Log>
void _write(Log& log, Pieces const& pieces, Line line) {
    switch (line) {
    case Line::narrow:
        return log.narrow(pieces);
    case Line::flushed:
        return log.flushed(pieces);
    case Line::stamped:
        return log.stamped(pieces);
    }
}

template <class Log>
Work _work(std::string const& path, Line line) {
    {
        Log log(path);
        for (int i = 0; i < 3; ++i) _write(log, Pieces(), line);
    }
    bench::require(std::filesystem::file_size(path) == 300, "a line has not 100 bytes");
    auto const log = std::make_shared<std::unique_ptr<Log>>();
    auto const open = [log, path] { *log = std::make_unique<Log>(path); };
    auto const close = [log] { log->reset(); };
    return Work::repeated([log, line, pieces = Pieces()] {
               _write(**log, pieces, line);
               return 0;
           })
        .within(open, close);
}

template <class Log>
bench::Peer _peer(std::string const& path, Line line) {
    if constexpr (bench::isMissing<Log>) {
        return bench::missing(Log::name);
    } else {
        return bench::peer(Log::name, _work<Log>(path, line));
    }
}

/// What DateTime's interface says that it asks the C library for a moment.
time_t _stampCalls() {
    time_t const now = ::time(nullptr);
    tm parts = *std::localtime(&now);
    time_t const local = std::mktime(&parts);
    parts = *std::gmtime(&local);
    return local - std::mktime(&parts);
}

} // namespace

int main(int argc, char** argv) {
    // Without it the C library looks for the zone's file again and again.
    ::setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
    bench::Report report("logs", bench::Options(argc, argv));
    bench::MemoryDirectory const directory;
    std::string const path = directory / "application.log";
    report.compare("narrow pieces", _work<Ours>(path, Line::narrow),
                   {bench::peer("std::ofstream", _work<Ofstream>(path, Line::narrow)),
                    _peer<Spdlog>(path, Line::narrow),
                    bench::limit("fprintf", _work<Fprintf>(path, Line::narrow))},
                   1.02);
    report.compare("narrow pieces, flushed", _work<Ours>(path, Line::flushed),
                   {bench::peer("std::ofstream", _work<Ofstream>(path, Line::flushed)),
                    _peer<Spdlog>(path, Line::flushed),
                    bench::limit("fprintf", _work<Fprintf>(path, Line::flushed))});
    report.compare(
        "time stamp and wide pieces", _work<Ours>(path, Line::stamped),
        {_peer<Spdlog>(path, Line::stamped),
         bench::limit("std::ofstream + strftime", _work<Ofstream>(path, Line::stamped), 1.2),
         bench::limit("fprintf + strftime", _work<Fprintf>(path, Line::stamped)),
         bench::limit("the stamp's C library calls", Work::repeated(_stampCalls))});
}
