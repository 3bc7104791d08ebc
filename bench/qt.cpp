#include "qt.h"

#ifdef KORU_BENCH_HAS_QT
#include <QtCore/QByteArray>
#include <QtCore/QLatin1String>
#include <QtCore/QString>
#include <QtCore/QUuid>
#endif

namespace bench {

#ifdef KORU_BENCH_HAS_QT

namespace {

QUuid _uuid(std::string const& text) {
    return QUuid::fromString(QLatin1String(text.data(), static_cast<int>(text.size())));
}

} // namespace

Work qtDecode(std::string const& text) {
    return Work::repeated([text] {
        return QString::fromUtf8(text.data(), static_cast<int>(text.size())).toStdWString();
    });
}

Work qtEncode(std::wstring const& text) {
    return Work::repeated([text] { return QString::fromStdWString(text).toStdString(); });
}

Work qtCompare(std::wstring const& a, std::wstring const& b) {
    QString const left = QString::fromStdWString(a);
    QString const right = QString::fromStdWString(b);
    return Work::repeated([left, right] {
        keep(left);
        keep(right);
        return QString::compare(left, right, Qt::CaseInsensitive);
    });
}

Work qtParse(std::vector<std::string> const& texts) {
    return Work::repeated([texts, at = 0U]() mutable {
        return QUuid(QByteArray::fromStdString(texts[at++ % texts.size()]));
    });
}

Work qtParseLatin1(std::vector<std::string> const& texts) {
    return Work::repeated([texts, at = 0U]() mutable { return _uuid(texts[at++ % texts.size()]); });
}

Work qtFormat(std::vector<std::string> const& texts) {
    std::vector<QUuid> identifiers;
    for (std::string const& text : texts) identifiers.push_back(_uuid(text));
    return Work::repeated([identifiers, at = 0U]() mutable {
        return identifiers[at++ % identifiers.size()].toByteArray(QUuid::WithoutBraces);
    });
}

#else

Work qtDecode(std::string const&) { return Work(); }
Work qtEncode(std::wstring const&) { return Work(); }
Work qtCompare(std::wstring const&, std::wstring const&) { return Work(); }
Work qtParse(std::vector<std::string> const&) { return Work(); }
Work qtParseLatin1(std::vector<std::string> const&) { return Work(); }
Work qtFormat(std::vector<std::string> const&) { return Work(); }

#endif

} // namespace bench
