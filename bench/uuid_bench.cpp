// Uuid: its text form in both directions, and comparison.
#include <koru/uuid.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <ostream>
#include <string>
#include <vector>

#include "circle.h"
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

/// An identifier of random bytes.
template <class Random>
Identifier _identifier(Random& random) {
    Identifier identifier;
    Bytes& bytes = identifier.bytes;
    for (unsigned char& byte : bytes) byte = static_cast<unsigned char>(random() & 0xFF);
    char text[36];
    identifier.text.assign(text, _hyphenated(bytes, text));
    identifier.ours = Koru::Uuid(std::vector<unsigned char>(bytes.begin(), bytes.end()));
#ifdef KORU_BENCH_HAS_BOOST
    std::copy(bytes.begin(), bytes.end(), identifier.boost.begin());
#endif
    return identifier;
}

using Identifiers = bench::Circle<Identifier>;

std::vector<std::string> _texts(Identifiers const& identifiers) {
    std::vector<std::string> texts;
    for (Identifier const& identifier : identifiers) texts.push_back(identifier.text);
    return texts;
}

#ifdef KORU_BENCH_HAS_LIBUUID
struct Libuuid {
    static constexpr char const* name = "libuuid";
    static Bytes parse(Identifier const& identifier) {
        Bytes bytes;
        ::uuid_parse(identifier.text.c_str(), bytes.data());
        return bytes;
    }
    static std::string format(Identifier const& identifier) {
        char text[37];
        ::uuid_unparse_lower(identifier.bytes.data(), text);
        return std::string(text, 36);
    }
    static bool areEqual(Identifier const& one, Identifier const& other) {
        return ::uuid_compare(one.bytes.data(), other.bytes.data()) == 0;
    }
};
#else
struct Libuuid : bench::Missing {
    static constexpr char const* name = "libuuid";
};
#endif

#ifdef KORU_BENCH_HAS_BOOST
struct Boost {
    static constexpr char const* name = "Boost";
    static boost::uuids::uuid parse(Identifier const& identifier) {
        return boost::uuids::string_generator()(identifier.text);
    }
    static std::string format(Identifier const& identifier) {
        return boost::uuids::to_string(identifier.boost);
    }
    static bool write(std::ostream& out, Identifier const& identifier) {
        return bool(out << identifier.boost);
    }
    static bool areEqual(Identifier const& one, Identifier const& other) {
        return one.boost == other.boost;
    }
};
#else
struct Boost : bench::Missing {
    static constexpr char const* name = "Boost";
};
#endif

void _parse(bench::Report& report, Identifiers const& identifiers) {
    for (Identifier const& identifier : identifiers) {
        bench::require(Koru::Uuid(identifier.text) == identifier.ours,
                       "the identifier was read as another one");
    }
    std::vector<std::string> const texts = _texts(identifiers);
    Work const ours = identifiers.each([](Identifier const& i) { return Koru::Uuid(i.text); });
    auto const parse = [&](auto library) {
        return identifiers.each([library](Identifier const& i) { return library.parse(i); });
    };
    report.compare("parse", ours,
                   {bench::peer("Qt, of a QByteArray", bench::qtParse(texts)),
                    bench::limit("Qt, of a view", bench::qtParseLatin1(texts)),
                    bench::peerOf<Libuuid>(parse), bench::peerOf<Boost>(parse)},
                   0.4);
}

void _format(bench::Report& report, Identifiers const& identifiers) {
    Work const ours = identifiers.each([](Identifier const& i) {
        std::string text = i.ours;
        return text;
    });
    for (Identifier const& identifier : identifiers) {
        std::string const text = identifier.ours;
        bench::require(text == identifier.text, "the identifier was written as another one");
    }
    Work const copy = identifiers.each([](Identifier const& i) { return std::string(i.text); });
    auto const format = [&](auto library) {
        return identifiers.each([library](Identifier const& i) { return library.format(i); });
    };
    report.compare("format", ours,
                   {bench::peer("Qt", bench::qtFormat(_texts(identifiers))),
                    bench::peerOf<Libuuid>(format), bench::peerOf<Boost>(format),
                    bench::limit("copy of the text", copy)},
                   0.8);
}

void _stream(bench::Report& report, Identifiers const& identifiers) {
    bench::FixedBuffer<char> buffer;
    std::ostream out(&buffer);
    Work const ours = identifiers.each([&](Identifier const& i) {
        buffer.rewind();
        out << i.ours;
        return 0;
    });
    Work const sputn = identifiers.each([&](Identifier const& i) {
        buffer.rewind();
        return out.rdbuf()->sputn(i.text.data(), 36);
    });
    auto const write = [&](auto library) {
        return identifiers.each([&, library](Identifier const& i) {
            buffer.rewind();
            return library.write(out, i);
        });
    };
    report.compare("stream", ours,
                   {bench::peerOf<Boost>(write), bench::limit("sputn of the text", sputn)}, 0.06);
}

/// Boost's comparison is inlined into the application, which no library call can match: a limit.
void _compare(bench::Report& report, Identifiers const& identifiers) {
    std::vector<Identifier> const one(identifiers.begin(), identifiers.end());
    std::vector<Identifier> const other = one;
    auto const compare = [&](auto areEqual) {
        return Work::repeated([&, areEqual, at = 0U]() mutable {
            std::size_t const i = at++ % one.size();
            return areEqual(one[i], other[i]);
        });
    };
    auto const byLibrary = [&](auto library) {
        return compare(
            [library](Identifier const& a, Identifier const& b) { return library.areEqual(a, b); });
    };
    Peer boost = bench::peerOf<Boost>(byLibrary);
    boost.name = "Boost, inlined";
    boost.isLimit = true;
    report.compare("compare, equal", compare([](Identifier const& a, Identifier const& b) {
                       return a.ours == b.ours;
                   }),
                   {bench::peerOf<Libuuid>(byLibrary),
                    bench::limit("memcmp", compare([](Identifier const& a, Identifier const& b) {
                                     return std::memcmp(a.bytes.data(), b.bytes.data(), 16);
                                 })),
                    boost},
                   0.6);
}

} // namespace

int main(int argc, char** argv) {
    Identifiers const identifiers([](auto& random) { return _identifier(random); });
    bench::Report report("identifiers", bench::Options(argc, argv));
    _parse(report, identifiers);
    _format(report, identifiers);
    _stream(report, identifiers);
    _compare(report, identifiers);
}
