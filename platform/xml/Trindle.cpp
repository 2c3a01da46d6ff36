#include "Trindle.h"

#include <QVariantMap>
#include <QXmlStreamReader>

#include <vector>

namespace {

const QString TEXT_KEY = QStringLiteral("#text");
const QChar ATTRIBUTE_PREFIX = QLatin1Char('@');
// Whoever walks or destroys the tree recurses once per level; deeper documents are refused.
const size_t MAX_DEPTH = 256;

// An element being read: its attributes and finished children so far, and its own text.
struct OpenElement {
    QString name;
    QVariantMap map;
    QString text;
    bool hasChildren = false;
    // Text that is more than white space, or came from a CDATA section.
    bool significantText = false;
};

// Element and attribute names repeat throughout a reply; handing out shared copies saves an
// allocation per element and per attribute.
class NameCache {
public:
    QString element(QStringView name) { return lookup(elementNames, name, false); }
    QString attribute(QStringView name) { return lookup(attributeKeys, name, true); }

private:
    static QString lookup(std::vector<QString>& names, QStringView name, bool prefixed) {
        const qsizetype offset = prefixed ? 1 : 0;
        for (const QString& known : names) {
            if (known.size() == name.size() + offset && QStringView(known).mid(offset) == name)
                return known;
        }
        QString made;
        made.reserve(name.size() + offset);
        if (prefixed)
            made.append(ATTRIBUTE_PREFIX);
        made.append(name);
        if (names.size() < MAX_NAMES)
            names.push_back(made);
        return made;
    }

    // Beyond this many distinct names a linear search costs more than it saves.
    static constexpr size_t MAX_NAMES = 48;
    std::vector<QString> elementNames;
    std::vector<QString> attributeKeys;
};

// A repeated child turns its entry into a list once; later repeats append in place.
void addChild(QVariantMap& map, const QString& name, const QVariant& value) {
    auto it = map.lowerBound(name);
    if (it == map.end() || it.key() != name) {
        map.insert(it, name, value);
        return;
    }
    QVariant& entry = it.value();
    if (entry.typeId() == QMetaType::QVariantList) {
        static_cast<QVariantList*>(entry.data())->append(value);
        return;
    }
    QVariantList list;
    list.reserve(4);
    list.append(std::move(entry));
    list.append(value);
    entry = QVariant(list);
}

} // namespace

Trindle::Trindle() = default;
Trindle::~Trindle() = default;

QVariant Trindle::parse(const QString& xml) {
    QXmlStreamReader reader(xml);
    reader.setNamespaceProcessing(false);

    NameCache names;
    std::vector<OpenElement> open;
    open.reserve(16);
    QVariantMap document;

    while (!reader.atEnd()) {
        switch (reader.readNext()) {
        case QXmlStreamReader::StartElement: {
            if (open.size() == MAX_DEPTH) {
                reader.raiseError(QStringLiteral("Elements nested too deeply."));
                break;
            }
            if (!open.empty()) {
                OpenElement& parent = open.back();
                if (!parent.hasChildren) {
                    parent.hasChildren = true;
                    if (!parent.significantText)
                        parent.text.clear();
                }
            }
            OpenElement element;
            element.name = names.element(reader.qualifiedName());
            const QXmlStreamAttributes attributes = reader.attributes();
            for (const QXmlStreamAttribute& attribute : attributes)
                element.map.insert(names.attribute(attribute.qualifiedName()),
                                   attribute.value().toString());
            open.push_back(std::move(element));
            break;
        }
        case QXmlStreamReader::Characters: {
            if (open.empty())
                break;
            OpenElement& element = open.back();
            const bool whitespace = reader.isWhitespace();
            if (whitespace && element.hasChildren)
                break;
            if (!whitespace)
                element.significantText = true;
            element.text.append(reader.text());
            break;
        }
        case QXmlStreamReader::EndElement: {
            OpenElement element = std::move(open.back());
            open.pop_back();
            QVariant value;
            if (element.map.isEmpty()) {
                value = QVariant(element.text);
            } else {
                if (!element.text.isEmpty())
                    element.map.insert(TEXT_KEY, element.text);
                value = QVariant(element.map);
            }
            if (open.empty())
                document.insert(element.name, value);
            else
                addChild(open.back().map, element.name, value);
            break;
        }
        default:
            // Comments, processing instructions, the DTD and unresolved entity references.
            break;
        }
    }
    if (reader.hasError() || document.isEmpty())
        return {};
    return QVariant(document);
}

QList<QVariant> Trindle::transContentAsList(const QVariant& value) {
    if (!value.isValid())
        return {};
    if (value.typeId() == QMetaType::QVariantList)
        return value.toList();
    return {value};
}
