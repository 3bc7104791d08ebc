// Uuid: its text form in both directions, and comparison.
#include <koru/uuid.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <ostream>
#include <random>
#include <string>
#include <vector>

#include "fixedbuffer.h"
#include "harness.h"
#include "qt.h"

#ifdef KORU_BENCH_HAS_BOOST
#include <boost/uuid/string_generator.hpp>
#include <boost/uuid/uuid.hpp>
#include <boost/uuid/uuid_io.hpp>
#endif
#ifdef KORU_BENCH_HAS_LIBUUID
#include <uuid/uuid.h>
#endif

namespace {

using bench::Peer;
using bench::Work;

using Bytes = std::array<unsigned char, 16>;

/// One identifier in all the forms that someone takes it in.
struct Identifier {
    Bytes bytes;
    std::string text;
    Koru::Uuid ours;
#ifdef KORU_BENCH_HAS_BOOST
    boost::uuids::uuid boost;
#endif
};

char* _hyphenated(Bytes const& bytes, char* to) {
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        if (i == 4 || i == 6 || i == 8 || i == 10) *to++ = '-';
        *to++ = "0123456789abcdef"[bytes[i] >> 4];
        *to++ = "0123456789abcdef"[bytes[i] & 0x0F];
    }
    return to;
}

Identifier _identifier(Bytes const& bytes) {
    Identifier identifier;
    identifier.bytes = bytes;
    char text[36];
    identifier.text.assign(text, _hyphenated(bytes, text));
    identifier.ours = Koru::Uuid(std::vector<unsigned char>(bytes.begin(), bytes.end()));
#ifdef KORU_BENCH_HAS_BOOST
    std::copy(bytes.begin(), bytes.end(), identifier.boost.begin());
#endif
    return identifier;
}

/// Identifiers that cannot be foreseen, handed out in a circle.
class Identifiers {
public:
    Identifiers() {
        std::mt19937 random(1);
        for (std::size_t i = 0; i < COUNT; ++i) {
            Bytes bytes;
            for (unsigned char& byte : bytes) byte = static_cast<unsigned char>(random() & 0xFF);
            identifiers_.push_back(_identifier(bytes));
        }
    }

    Identifier const& next() { return identifiers_[at_++ % COUNT]; }
    Identifier const* begin() const { return identifiers_.data(); }
    Identifier const* end() const { return identifiers_.data() + COUNT; }
    std::vector<std::string> texts() const {
        std::vector<std::string> texts;
        for (Identifier const& identifier : identifiers_) texts.push_back(identifier.text);
        return texts;
    }

private:
    static constexpr std::size_t COUNT = 64;

    std::vector<Identifier> identifiers_;
    std::size_t at_ = 0;
};

void _parse(bench::Report& report, Identifiers identifiers) {
    for (Identifier const& identifier : identifiers) {
        bench::require(Koru::Uuid(identifier.text) == identifier.ours,
                       "the identifier was read as another one");
    }
    std::vector<Peer> peers = {
        bench::peer("Qt, of a QByteArray", bench::qtParse(identifiers.texts())),
        bench::limit("Qt, of a view", bench::qtParseLatin1(identifiers.texts()))};
#ifdef KORU_BENCH_HAS_LIBUUID
    peers.push_back(bench::peer("libuuid", Work::repeated([identifiers]() mutable {
                                    Bytes bytes;
                                    ::uuid_parse(identifiers.next().text.c_str(), bytes.data());
                                    return bytes;
                                })));
#else
    peers.push_back(bench::missing("libuuid"));
#endif
#ifdef KORU_BENCH_HAS_BOOST
    peers.push_back(bench::peer("Boost", Work::repeated([identifiers]() mutable {
                                    return boost::uuids::string_generator()(
                                        identifiers.next().text);
                                })));
#else
    peers.push_back(bench::missing("Boost"));
#endif
    report.compare("parse", Work::repeated([identifiers]() mutable {
                       return Koru::Uuid(identifiers.next().text);
                   }),
                   peers, 0.4);
}

void _format(bench::Report& report, Identifiers identifiers) {
    for (Identifier const& identifier : identifiers) {
        std::string const text = identifier.ours;
        bench::require(text == identifier.text, "the identifier was written as another one");
    }
    std::vector<Peer> peers = {bench::peer("Qt", bench::qtFormat(identifiers.texts()))};
#ifdef KORU_BENCH_HAS_LIBUUID
    peers.push_back(bench::peer("libuuid", Work::repeated([identifiers]() mutable {
                                    char text[37];
                                    ::uuid_unparse_lower(identifiers.next().bytes.data(), text);
                                    return std::string(text, 36);
                                })));
#else
    peers.push_back(bench::missing("libuuid"));
#endif
#ifdef KORU_BENCH_HAS_BOOST
    peers.push_back(bench::peer("Boost", Work::repeated([identifiers]() mutable {
                                    return boost::uuids::to_string(identifiers.next().boost);
                                })));
#else
    peers.push_back(bench::missing("Boost"));
#endif
    peers.push_back(bench::limit("copy of the text", Work::repeated([identifiers]() mutable {
                                     return std::string(identifiers.next().text);
                                 })));
    report.compare("format", Work::repeated([identifiers]() mutable {
                       std::string text = identifiers.next().ours;
                       return text;
                   }),
                   peers, 0.8);
}

void _stream(bench::Report& report, Identifiers identifiers) {
    bench::FixedBuffer<char> buffer;
    std::ostream out(&buffer);
    std::vector<Peer> peers;
#ifdef KORU_BENCH_HAS_BOOST
    peers.push_back(bench::peer("Boost", Work::repeated([&] {
                                    buffer.rewind();
                                    out << identifiers.next().boost;
                                    return 0;
                                })));
#else
    peers.push_back(bench::missing("Boost"));
#endif
    peers.push_back(bench::limit("sputn of the text", Work::repeated([&] {
                                     std::string const& text = identifiers.next().text;
                                     buffer.rewind();
                                     return out.rdbuf()->sputn(text.data(), 36);
                                 })));
    report.compare("stream", Work::repeated([&] {
                       buffer.rewind();
                       out << identifiers.next().ours;
                       return 0;
                   }),
                   peers, 0.06);
}

/// Boost's comparison is inlined into the application, which no library call can match: a limit.
void _compare(bench::Report& report, Identifiers const& identifiers) {
    std::vector<Identifier> const one(identifiers.begin(), identifiers.end());
    std::vector<Identifier> const other = one;
    std::vector<Peer> peers;
#ifdef KORU_BENCH_HAS_LIBUUID
    peers.push_back(bench::peer("libuuid", Work::repeated([&one, &other, at = 0U]() mutable {
                                    std::size_t const i = at++ % one.size();
                                    return ::uuid_compare(one[i].bytes.data(),
                                                          other[i].bytes.data()) == 0;
                                })));
#else
    peers.push_back(bench::missing("libuuid"));
#endif
    peers.push_back(bench::limit("memcmp", Work::repeated([&one, &other, at = 0U]() mutable {
                                     std::size_t const i = at++ % one.size();
                                     return std::memcmp(one[i].bytes.data(), other[i].bytes.data(),
                                                        16);
                                 })));
#ifdef KORU_BENCH_HAS_BOOST
    peers.push_back(
        bench::limit("Boost, inlined", Work::repeated([&one, &other, at = 0U]() mutable {
                         std::size_t const i = at++ % one.size();
                         return one[i].boost == other[i].boost;
                     })));
#endif
    report.compare("compare, equal", Work::repeated([&one, &other, at = 0U]() mutable {
                       std::size_t const i = at++ % one.size();
                       return one[i].ours == other[i].ours;
                   }),
                   peers, 0.6);
}

} // namespace

int main(int argc, char** argv) {
    Identifiers const identifiers;
    bench::Report report("identifiers", bench::Options(argc, argv));
    _parse(report, identifiers);
    _format(report, identifiers);
    _stream(report, identifiers);
    _compare(report, identifiers);
}
