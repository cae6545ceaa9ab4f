#include <AlarmSearchLimits.h>
#include <XML2Json.h>

#include <QtTest>

namespace {

using Map = QVariantMap;
using List = QVariantList;

QString nested(int depth)
{
    return QStringLiteral("<e>").repeated(depth) + QStringLiteral("</e>").repeated(depth);
}

// The rendering of nested(depth): the innermost element renders as an empty text.
QVariant nestedRendering(int depth)
{
    QVariant value = QString("");
    for (int i = 0; i < depth; ++i)
        value = Map{{QStringLiteral("e"), value}};
    return value;
}

} // namespace

class TestXml2Json : public QObject
{
    Q_OBJECT

private slots:
    void rendering_data()
    {
        QTest::addColumn<QString>("xml");
        QTest::addColumn<QVariant>("expected");

        QTest::newRow("empty element, whitespace around root")
            << "\n <?xml-stylesheet x?> <R/>\n <!--c-->\n"
            << QVariant(Map{{"R", ""}});
        QTest::newRow("leaf keeps whitespace")
            << "<R>  a b \n</R>" << QVariant(Map{{"R", "  a b \n"}});
        QTest::newRow("example") << "<R><A>1</A><A>2</A><B x=\"y\">t</B><C></C></R>"
                                 << QVariant(Map{{"R", Map{{"A", List{"1", "2"}},
                                                           {"B", Map{{"@x", "y"}, {"#text", "t"}}},
                                                           {"C", ""}}}});
        QTest::newRow("attributes, one the name of a child")
            << "<R a='1' b=\"two\" A='x'><A>y</A></R>"
            << QVariant(Map{{"R", Map{{"@a", "1"}, {"@b", "two"}, {"@A", "x"}, {"A", "y"}}}});
        QTest::newRow("repeated names keep document order")
            << "<R><A>3</A><B>b</B><A>1</A><A>2</A><C k='1'/><C>t</C><C><x>1</x></C></R>"
            << QVariant(Map{{"R", Map{{"A", List{"3", "1", "2"}},
                                      {"B", "b"},
                                      {"C", List{Map{{"@k", "1"}}, "t", Map{{"x", "1"}}}}}}});
        QTest::newRow("mixed text")
            << "<R>a<B>b</B>c <C/> d</R>"
            << QVariant(Map{{"R", Map{{"B", "b"}, {"C", ""}, {"#text", "ac  d"}}}});
        QTest::newRow("whitespace between children ignored")
            << "<R>\n  <A>1</A>\n  <B> </B>\n  <C a='1'>\n </C>\n</R>"
            << QVariant(Map{{"R", Map{{"A", "1"}, {"B", " "}, {"C", Map{{"@a", "1"}}}}}});
        QTest::newRow("CDATA is text")
            << "<R><A><![CDATA[<b>&amp;</b>]]></A><B>x<![CDATA[y]]>z</B><C k='v'>a<![CDATA[ b "
               "]]></C></R>"
            << QVariant(Map{{"R", Map{{"A", "<b>&amp;</b>"},
                                      {"B", "xyz"},
                                      {"C", Map{{"@k", "v"}, {"#text", "a b "}}}}}});
        QTest::newRow("comments and PIs skipped")
            << "<?xml version='1.0'?><!--c--><R><!--c--><A>1<!--c-->2</A><?pi "
               "x?><B/><C><!--c--></C></R><!--c-->"
            << QVariant(Map{{"R", Map{{"A", "12"}, {"B", ""}, {"C", ""}}}});
        QTest::newRow("deepest read")
            << nested(AlarmSearchLimits::MaxDepth) << nestedRendering(AlarmSearchLimits::MaxDepth);
        QTest::newRow("entities and character references")
            << "<R a='&lt;&quot;&#x41;'><T>&amp;&lt;&gt;&apos;&quot; &#65;&#x263A;</T></R>"
            << QVariant(
                   Map{{"R", Map{{"@a", "<\"A"}, {"T", QString::fromUtf8("&<>'\" A\u263A")}}}});
        QTest::newRow("qualified names as written, non-ASCII text")
            << QString::fromUtf8("<p:R xmlns:p='urn:x'><p:A>1</p:A><A>Süd 東</A></p:R>")
            << QVariant(Map{
                   {"p:R",
                    Map{{"@xmlns:p", "urn:x"}, {"p:A", "1"}, {"A", QString::fromUtf8("Süd 東")}}}});
    }

    void rendering()
    {
        QFETCH(QString, xml);
        QFETCH(QVariant, expected);
        XML2Json converter;
        QCOMPARE(converter.parse(xml), expected);
        QCOMPARE(converter.errorString(), QString());
    }

    void emptyTextIsNotNull()
    {
        const QVariant empty =
            XML2Json().parse(QStringLiteral("<R><A/></R>")).toMap().value("R").toMap().value("A");
        QVERIFY(!empty.toString().isNull());
    }

    void transContentAsList_data()
    {
        QTest::addColumn<QVariant>("value");
        QTest::addColumn<QVariantList>("expected");
        const Map map{{"a", "1"}};
        QTest::newRow("list") << QVariant(List{map, "t"}) << List{map, "t"};
        QTest::newRow("single map") << QVariant(map) << List{map};
        QTest::newRow("single text") << QVariant("t") << List{"t"};
        QTest::newRow("invalid") << QVariant() << List{};
    }

    void transContentAsList()
    {
        QFETCH(QVariant, value);
        QFETCH(QVariantList, expected);
        QCOMPARE(XML2Json::transContentAsList(value), expected);
    }

    void refusals_data()
    {
        QTest::addColumn<QString>("xml");
        QTest::newRow("null text") << QString();
        QTest::newRow("empty text") << "";
        QTest::newRow("plain text") << "not xml";
        QTest::newRow("truncated") << "<R><A>1</A>";
        QTest::newRow("two roots") << "<R/><S/>";
        QTest::newRow("raw U+0001") << QStringLiteral("<R>a") + QChar(0x1) + QStringLiteral("</R>");
        QTest::newRow("reference to U+0001") << "<R>&#1;</R>";
        QTest::newRow("undeclared entity") << "<R>&nbsp;</R>";
        QTest::newRow("DTD without entities") << "<!DOCTYPE R><R/>";
        QTest::newRow("external entity")
            << "<!DOCTYPE R [<!ENTITY x SYSTEM 'file:///etc/passwd'>]><R>&x;</R>";
        QTest::newRow("entity bomb") << "<!DOCTYPE R [<!ENTITY e \"" + QString(4000, u'x') +
                                            "\">]><R>" + QStringLiteral("&e;").repeated(400000) +
                                            "</R>";
        QTest::newRow("depth 100000") << nested(100000);
        QTest::newRow("depth 100000 unclosed") << QString(QStringLiteral("<e>")).repeated(100000);
    }

    void refusals()
    {
        QFETCH(QString, xml);
        XML2Json converter;
        QVERIFY(converter.parse(QStringLiteral("<ok/>")).isValid());
        QVERIFY(!converter.parse(xml).isValid());
        QVERIFY(!converter.errorString().isEmpty());
    }

    void depthBound()
    {
        XML2Json converter;
        QVERIFY(!converter.parse(nested(AlarmSearchLimits::MaxDepth + 1)).isValid());
        QVERIFY(converter.errorString().contains(QLatin1String("256")));
    }
};

QTEST_GUILESS_MAIN(TestXml2Json)
#include "tst_xml2json.moc"
