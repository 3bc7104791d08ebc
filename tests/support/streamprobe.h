// All that can be seen of an insertion into a stream, for comparing two ways of writing.
#ifndef KORU_TESTS_STREAMPROBE_H
#define KORU_TESTS_STREAMPROBE_H

#include <cstddef>
#include <cstdint>
#include <ios>
#include <locale>
#include <ostream>
#include <sstream>
#include <streambuf>
#include <string>

#include "support/differences.h"

namespace test {

/// How a stream and its buffer are prepared before something is inserted.
struct StreamSetup {
    std::size_t room = SIZE_MAX;    ///< characters that the buffer takes before it refuses
    std::size_t throwAt = SIZE_MAX; ///< number of the character at which the buffer throws
    std::size_t syncs = SIZE_MAX;   ///< synchronisations before one fails
    std::size_t putArea = 0;
    std::streamsize width = 0;
    char fill = ' ';
    std::ios::fmtflags flags = {};
    std::ios::iostate state = std::ios::goodbit;
    std::ios::iostate exceptions = std::ios::goodbit;
    std::locale locale = std::locale::classic();
    bool isTied = false;
    bool tieFails = false;
    bool hasBuffer = true;
    bool isUnwinding = false; ///< the insertion happens while an exception is under way
};

struct SinkFailure {};

/// A buffer that logs every character that reaches it and every synchronisation, in order.
class Sink : public std::streambuf {
public:
    Sink(std::string& log, StreamSetup const& setup)
        : log_(log), setup_(setup), area_(setup.putArea, '\0') {
        if (!area_.empty()) setp(&area_[0], &area_[0] + area_.size());
    }
    std::string pending() const { return std::string(pbase(), pptr()); }

protected:
    int_type overflow(int_type c) override {
        for (char const* p = pbase(); p != pptr(); ++p) {
            if (!take(*p)) return traits_type::eof();
        }
        setp(pbase(), epptr());
        if (traits_type::eq_int_type(c, traits_type::eof())) return traits_type::not_eof(c);
        return take(traits_type::to_char_type(c)) ? c : traits_type::eof();
    }
    int sync() override {
        log_ += "<sync>";
        return syncs_++ < setup_.syncs ? 0 : -1;
    }

private:
    bool take(char c) {
        if (taken_ == setup_.throwAt) throw SinkFailure();
        if (taken_ >= setup_.room) return false;
        ++taken_;
        log_ += c;
        return true;
    }

    std::string& log_;
    StreamSetup const& setup_;
    std::string area_;
    std::size_t taken_ = 0;
    std::size_t syncs_ = 0;
};

/// The buffer of a tied stream: its flushes appear in the same log.
struct TiedSink : std::streambuf {
    TiedSink(std::string& theLog, bool itFails) : log(theLog), fails(itFails) {}
    int sync() override {
        log += "<tie>";
        return fails ? -1 : 0;
    }
    std::string& log;
    bool fails;
};

template <class Insert>
std::string thrownBy(std::ostream& os, Insert& insert) {
    try {
        return &insert(os) == &os ? "nothing" : "nothing, but gave another stream";
    } catch (SinkFailure const&) {
        return "the sink's exception";
    } catch (std::ios::failure const& failure) {
        return failure.what();
    }
}

template <class Insert>
std::string thrownWhileUnwinding(std::ostream& os, Insert& insert) {
    struct InsertsWhenDestroyed {
        std::ostream& os;
        Insert& insert;
        std::string& thrown;
        ~InsertsWhenDestroyed() { thrown = thrownBy(os, insert); }
    };
    std::string thrown;
    try {
        InsertsWhenDestroyed const object{os, insert, thrown};
        throw 1;
    } catch (int) {
    }
    return thrown;
}

/// What reached the buffer in which order, the stream's state afterwards and what was thrown.
template <class Insert>
std::string observed(StreamSetup const& setup, Insert insert) {
    std::string log;
    Sink sink(log, setup);
    TiedSink tiedSink(log, setup.tieFails);
    std::ostream tied(&tiedSink);
    if (setup.tieFails) tied.exceptions(std::ios::badbit);
    std::ostream os(setup.hasBuffer ? &sink : nullptr);
    os.imbue(setup.locale);
    if (setup.isTied) os.tie(&tied);
    os.width(setup.width);
    os.fill(setup.fill);
    os.setf(setup.flags);
    try {
        os.clear(os.rdstate() | setup.state);
        os.exceptions(setup.exceptions);
    } catch (std::ios::failure const&) {
        // The mask is set all the same, and the stream fails from the start.
    }
    std::string const thrown =
        setup.isUnwinding ? thrownWhileUnwinding(os, insert) : thrownBy(os, insert);
    std::ostringstream all;
    all << "wrote [" << log << "] pending [" << sink.pending() << "] state " << os.rdstate()
        << " flags " << os.flags() << " precision " << os.precision() << " width " << os.width()
        << " fill [" << os.fill() << "] threw " << thrown;
    os.exceptions(std::ios::goodbit);
    return all.str();
}

/// A stream that is odd in some ways.
inline StreamSetup randomSetup(Random& random) {
    static std::size_t const rooms[] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 43, 80};
    static std::streamsize const widths[] = {-4, 1, 2, 3, 5, 6, 12, 300};
    static std::ios::fmtflags const flagses[] = {std::ios::left,
                                                 std::ios::right,
                                                 std::ios::internal | std::ios::showpos,
                                                 std::ios::unitbuf,
                                                 std::ios::unitbuf | std::ios::left,
                                                 std::ios::scientific | std::ios::showpoint,
                                                 std::ios::hex | std::ios::showbase |
                                                     std::ios::uppercase};
    auto const isOdd = [&random] { return random.below(4) == 0; };
    StreamSetup setup;
    if (isOdd()) setup.room = random.of(rooms);
    if (isOdd()) setup.throwAt = random.of(rooms);
    if (isOdd()) setup.syncs = random.below(4);
    if (isOdd()) setup.putArea = random.of(rooms);
    if (isOdd()) setup.width = random.of(widths);
    if (isOdd()) setup.flags = random.of(flagses);
    if (isOdd()) setup.state = static_cast<std::ios::iostate>(random.below(8));
    setup.fill = isOdd() ? '*' : ' ';
    setup.exceptions = static_cast<std::ios::iostate>(random.below(8));
    setup.isTied = isOdd();
    setup.tieFails = isOdd();
    setup.hasBuffer = random.below(16) != 0;
    setup.isUnwinding = isOdd();
    // The C++ library ends the process when a flush fails that would have to throw.
    if (setup.syncs != SIZE_MAX) setup.exceptions = std::ios::goodbit;
    return setup;
}

/// Compares a way of inserting with another one that does the same, on streams of all kinds.
template <class Insert, class Expected>
void expectSameInsertions(Differences& differences, StreamSetup const& setup, Insert insert,
                          Expected expected) {
    std::ostringstream label;
    label << "room " << setup.room << " throw at " << setup.throwAt << " syncs " << setup.syncs
          << " put area " << setup.putArea << " width " << setup.width << " flags " << setup.flags
          << " state " << setup.state << " exceptions " << setup.exceptions << " tied "
          << setup.isTied << " fails " << setup.tieFails << " buffer " << setup.hasBuffer
          << " unwinding " << setup.isUnwinding;
    differences.expect(label.str(), observed(setup, insert), observed(setup, expected));
}

/// A locale with a decimal comma and a point before each digit but the first.
inline std::locale groupingLocale() {
    struct Grouping : std::numpunct<char> {
        char do_decimal_point() const override { return ','; }
        char do_thousands_sep() const override { return '.'; }
        std::string do_grouping() const override { return "\1"; }
    };
    return std::locale(std::locale::classic(), new Grouping);
}

/// The global C++ locale for the time of a scope.
class GlobalLocale {
public:
    explicit GlobalLocale(std::locale const& locale) : previous_(std::locale::global(locale)) {}
    GlobalLocale(GlobalLocale const&) = delete;
    GlobalLocale& operator=(GlobalLocale const&) = delete;
    ~GlobalLocale() { std::locale::global(previous_); }

private:
    std::locale previous_;
};

} // namespace test

#endif
