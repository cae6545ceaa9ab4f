#include "support/AlarmReplies.h"

#include "support/DomReference.h"

#include <AlarmListScanner.h>
#include <AlarmSearchLimits.h>
#include <AlarmXmlParser.h>
#include <DomAttributeOrder.h>
#include <XML2Json.h>
#include <XmlHelper.h>

#include <QDomDocument>
#include <QLibraryInfo>
#include <QXmlStreamReader>
#include <QtTest>

namespace {

// Which reader answers a reply: the one-pass scanner (whose answer must equal the general
// route's), the general route alone, or neither.
enum class Route { Scanner, General, Refused };

QString wrap(const QString& alarms)
{
    return QStringLiteral("<QryAlarmListRes>") + alarms + QStringLiteral("</QryAlarmListRes>");
}

QString nested(const QString& name, int depth, const QString& inner = QString())
{
    return QStringLiteral("<%1>").arg(name).repeated(depth) + inner +
           QStringLiteral("</%1>").arg(name).repeated(depth);
}

// Levels of the node's subtree, the node itself being one, counted without recursion.
int levels(const QDomNode& top)
{
    int deepest = 0;
    int level = 1;
    for (QDomNode node = top;;) {
        deepest = std::max(deepest, level);
        if (node.hasChildNodes()) {
            node = node.firstChild();
            ++level;
            continue;
        }
        while (node != top && node.nextSibling().isNull()) {
            node = node.parentNode();
            --level;
        }
        if (node == top)
            return deepest;
        node = node.nextSibling();
    }
}

// Every node of the document, in document order, found without recursion.
QList<QDomNode> allNodes(const QDomDocument& document)
{
    QList<QDomNode> nodes;
    for (QDomNode node = document.firstChild(); !node.isNull();) {
        nodes.append(node);
        if (node.hasChildNodes()) {
            node = node.firstChild();
            continue;
        }
        while (!node.isNull() && node.nextSibling().isNull())
            node = node.parentNode();
        if (!node.isNull())
            node = node.nextSibling();
    }
    return nodes;
}

} // namespace

class TestReplyDifferential : public QObject
{
    Q_OBJECT

private slots:
    void replies_data()
    {
        QTest::addColumn<QString>("reply");
        QTest::addColumn<Route>("route");

        const auto scanner = [](const char* name, const QString& reply) {
            QTest::newRow(name) << reply << Route::Scanner;
        };
        const auto general = [](const char* name, const QString& reply) {
            QTest::newRow(name) << reply << Route::General;
        };
        const auto refused = [](const char* name, const QString& reply) {
            QTest::newRow(name) << reply << Route::Refused;
        };

        scanner("generated 60 alarms", AlarmReplies::reply(60));
        scanner("one alarm, no white space", wrap(AlarmReplies::alarm(4)));
        scanner("history reply", "<GetAlarmInfoRes><Alarm><AlarmID>A1</AlarmID><ChangeLogs><Entry>"
                                 "<State>New</State></Entry><Entry><Note/></Entry></ChangeLogs>"
                                 "</Alarm></GetAlarmInfoRes>");
        for (AlarmReplies::Shape shape : AlarmReplies::Shapes)
            scanner(AlarmReplies::shapeName(shape), AlarmReplies::shapedReply(shape, 8));
        scanner("distinct names, ranked as they come",
                AlarmReplies::shapedReply(AlarmReplies::Shape::DistinctNames, 100));
        scanner("indented alarms",
                "<QryAlarmListRes>\n  <Total>2</Total>\n  <Alarm>\n    <AlarmID>1</AlarmID>\n"
                "    <Note/>\n  </Alarm>\n  <Alarm>\n    <AlarmID>2</AlarmID>\n  </Alarm>\n"
                "</QryAlarmListRes>\n");
        scanner("predefined entities and character references",
                wrap("<Alarm><Note>&amp;&lt;&gt;&quot;&apos; &#65;&#x263A;&#x1F6A8;&#160;"
                     "&#0000065;</Note></Alarm>"));
        scanner("escaped close of CDATA", wrap("<Alarm><N>a]]&gt;b ]] > c]]&gt;&gt;</N></Alarm>"));
        scanner("quotes in text", wrap("<Alarm><N>say \"hi\" 'x'</N></Alarm>"));
        scanner("attribute with quotes, tabs and line feeds",
                wrap("<Alarm id=\"a&quot;b&apos;\"><N t='x&#x9;y&#10;z\"'>1</N>"
                     "<M raw=\"l1\nl2\tl3\">2</M><K v=\"&lt;&gt;]]>&amp;\"/></Alarm>"));
        scanner("several attributes in hash order",
                wrap("<Alarm a='1' b='2' c='3' d='4'><N x='1' y='2'/><M z1='1' z2='2' z3='3' "
                     "z4='4' z5='5' z6='6'>t</M></Alarm><Alarm ID='2' Kind='x'/><Alarm ID='2' "
                     "Kind='x'/>"));
        scanner("white-space-only texts",
                wrap("<Alarm><A>  \n\t </A><B>&#160;</B><C>" + QString(QChar(0x3000)) + "</C><D>" +
                     QString(QChar(0x85)) + "</D><E>" + QString(QChar(0x2028)) +
                     "</E><F>&#32;</F><G> &#x2003; </G></Alarm>"));
        scanner("characters that are not white space",
                wrap("<Alarm><A>" + QString(QChar(0x200B)) + "</A><B>" + QString(QChar(0xFEFF)) +
                     "</B><C>" + QString(QChar(0x80)) + QString(QChar(0x9F)) + "</C><D>" +
                     QString(QChar(0xE000)) + QString(QChar(0xFFFD)) + "</D></Alarm>"));
        scanner("mixed content",
                wrap("<Alarm>lead<A>1</A>mid<B/> tail </Alarm><Alarm> <A>1</A> text <B>2</B> "
                     "</Alarm><Alarm>x<A/> <B/>y<C>  </C>\n</Alarm>"));
        scanner("text beside the alarms",
                "<QryAlarmListRes>before<Alarm/>between<Alarm><A/></Alarm> <Alarm>t</Alarm>after"
                "</QryAlarmListRes>");
        scanner("text only after an alarm",
                "<QryAlarmListRes><Alarm><A/></Alarm>&amp;</QryAlarmListRes>");
        scanner("element with attributes and text",
                wrap("<Alarm><Name lang=\"en\">Door</Name><Note a=\"1\"> </Note>"
                     "<Mix a='1'>x <y/> z</Mix></Alarm>"));
        scanner("nested and grandchild alarms",
                wrap("<Alarm><Alarm><AlarmID>inner</AlarmID></Alarm></Alarm>"
                     "<Group><Alarm><AlarmID>grandchild</AlarmID></Alarm></Group><alarm/>"));
        scanner("alarm with an XML child",
                wrap("<Alarm><AlarmID>2</AlarmID><XML>own</XML></Alarm>"));
        scanner("repeated child names",
                wrap("<Alarm><Tag>a</Tag><Tag>b</Tag><Tag><x/></Tag><Tag k='v'/></Alarm>"));
        scanner("repeated names among others, keys of every kind",
                wrap("<Alarm b='1' A='2'>t<Tag>a</Tag><B>1</B><Tag>b</Tag><a x='1'/><Tag>c</Tag>"
                     "u<B>2</B><_c/><a/></Alarm><Alarm><a/><Tag>d</Tag><A/></Alarm>"));
        scanner("empty elements", wrap("<Alarm/><Alarm></Alarm><Alarm><A></A><B/></Alarm>"));
        scanner("alarm of text only", wrap("<Alarm>just text</Alarm>"));
        scanner("XML declaration", "<?xml version=\"1.0\"?>" + wrap("<Alarm/>"));
        scanner("full XML declaration", "<?xml version='1.0' encoding='utf-8' standalone='yes' ?>"
                                        "\n\n" +
                                            wrap("<Alarm><A>1</A></Alarm>") + "\n");
        scanner("surrogate pairs",
                wrap(QString::fromUtf8("<Alarm k='\U0001F600'><N>a\U0001F6A8b\U00010000</N>"
                                       "</Alarm>")));
        scanner("long texts",
                wrap("<Alarm><Note>" + QStringLiteral("word &amp; &lt;tag&gt; ").repeated(5000) +
                     "</Note><Text>" + QString(100000, QLatin1Char('z')) + "</Text></Alarm>"));
        scanner("other document element", "<Other><Alarm><A>1</A></Alarm></Other>");
        scanner("reply element as text", "<QryAlarmListRes>text</QryAlarmListRes>");
        scanner("empty reply element", "<QryAlarmListRes/>");
        scanner("reply element with attributes",
                "<QryAlarmListRes Alarm='x' n='1'><Alarm/></QryAlarmListRes>");
        scanner("spaces inside tags",
                wrap("<Alarm  a = \"1\"\n\tb='2' ><A\n/><B >x</B\n></Alarm >"));
        scanner("name characters",
                wrap("<Alarm><a.b-c_d9 _x='1'>v</a.b-c_d9><xmlData xmlx='1'/></Alarm>"));
        scanner("depth 256",
                wrap("<Alarm>" + nested("e", AlarmSearchLimits::MaxDepth - 2) + "</Alarm>"));
        scanner("alarms far apart", wrap("<Alarm><A>1</A></Alarm>" + nested("x", 200, "deep") +
                                         "<Alarm><A>2</A></Alarm>"));

        general("comment in an alarm", wrap("<Alarm><A>x<!--c-->y</A><!-- c- --><B/></Alarm>"));
        general("comment before the root", "<!--c-->" + wrap("<Alarm/>"));
        general("processing instruction", wrap("<Alarm><?pi d?><B/>t<?q?></Alarm>"));
        general("CDATA", wrap("<Alarm><A><![CDATA[<b>&amp;</b>]]></A><B><![CDATA[ ]]></B>"
                              "<C>x<![CDATA[y]]>z</C><D><E/><![CDATA[c]]></D></Alarm>"));
        general(
            "prefixed names",
            "<r:QryAlarmListRes xmlns:r='urn:r'><Alarm><r:A>1</r:A></Alarm></r:QryAlarmListRes>");
        general("namespace declaration", wrap("<Alarm xmlns='urn:x'><A>1</A></Alarm>"));
        general("byte order mark", QString(QChar(0xFEFF)) + wrap("<Alarm/>"));
        general("carriage returns", wrap("<Alarm>\r\n<A>x\r\ny\rz</A><B c='1\r\n2'/></Alarm>"));
        general("reference to a tab", wrap("<Alarm><A>&#9;</A><B>a&#13;b</B></Alarm>"));
        refused("lone surrogate", wrap("<Alarm><A>" + QString(QChar(0xD800)) + "</A></Alarm>"));
        general("non-ASCII name", wrap(QString::fromUtf8("<Alarm><Größe>1</Größe></Alarm>")));
        general("other encoding", "<?xml version='1.0' encoding='ISO-8859-1'?>" + wrap("<Alarm/>"));
        general("33 attributes", wrap("<Alarm " + [] {
                    QString attributes;
                    for (int i = 0; i < 33; ++i)
                        attributes += QStringLiteral("a%1='%1' ").arg(i);
                    return attributes;
                }() + "/>"));

        refused("empty", QString());
        refused("not XML", "Alarm");
        refused("truncated", "<QryAlarmListRes><Alarm><A>1</A>");
        refused("truncated tag", wrap("<Alarm/>").chopped(1));
        refused("mismatched tags", wrap("<Alarm><A></B></Alarm>"));
        refused("two roots", wrap("<Alarm/>") + "<Other/>");
        refused("text after root", wrap("<Alarm/>") + "tail");
        refused("duplicate attribute", wrap("<Alarm a='1' a='2'/>"));
        refused("unquoted attribute", wrap("<Alarm a=1/>"));
        refused("attribute without space", wrap("<Alarm a='1'b='2'/>"));
        refused("markup in attribute", wrap("<Alarm a='<'/>"));
        refused("close of CDATA in text", wrap("<Alarm><A>a]]>b</A></Alarm>"));
        refused("undeclared entity", wrap("<Alarm><A>&nbsp;</A></Alarm>"));
        refused("lone ampersand", wrap("<Alarm><A>a & b</A></Alarm>"));
        refused("reference to U+0000", wrap("<Alarm><A>&#0;</A></Alarm>"));
        refused("reference to a surrogate", wrap("<Alarm><A>&#xD800;</A></Alarm>"));
        refused("reference beyond Unicode", wrap("<Alarm><A>&#x110000;</A></Alarm>"));
        refused("raw U+0001", wrap("<Alarm><A>" + QString(QChar(0x1)) + "</A></Alarm>"));
        refused("raw U+FFFE", wrap("<Alarm><A>" + QString(QChar(0xFFFE)) + "</A></Alarm>"));
        refused("document type", "<!DOCTYPE QryAlarmListRes>" + wrap("<Alarm/>"));
        refused("entity bomb", "<!DOCTYPE R [<!ENTITY a 'aaaaaaaa'><!ENTITY b '&a;&a;&a;&a;'>]>" +
                                   wrap("<Alarm><A>&b;</A></Alarm>"));
        refused("depth 257",
                wrap("<Alarm>" + nested("e", AlarmSearchLimits::MaxDepth - 1) + "</Alarm>"));
        refused("upper-case hexadecimal marker", wrap("<Alarm><A>&#X41;</A></Alarm>"));
        refused("declaration not at the start", " <?xml version='1.0'?>" + wrap("<Alarm/>"));
    }

    // The scanner, when it answers, answers as the general route does; the combined reader
    // always does.
    void replies()
    {
        QFETCH(QString, reply);
        QFETCH(Route, route);

        const std::optional<QVariantList> general =
            AlarmXmlParser::readAlarmListReplyGeneral(reply);
        const std::optional<QVariantList> scanned = AlarmListScanner::read(reply);
        QCOMPARE(scanned.has_value(), route == Route::Scanner);
        QCOMPARE(general.has_value(), route != Route::Refused);
        QCOMPARE(AlarmXmlParser::readAlarmListReply(reply), general);
        // The other readers' route: the same form read whole, rendered as XML2Json renders it.
        const QVariant parsed = XML2Json().parse(reply);
        const std::optional<QVariantMap> document = AlarmListScanner::readDocument(reply);
        QCOMPARE(document.has_value(), route == Route::Scanner);
        QCOMPARE(AlarmXmlParser::readReply(reply), document ? QVariant(*document) : parsed);
        QCOMPARE(AlarmXmlParser::readReply(reply), parsed);
        if (!scanned)
            return;

        // Maps and texts apart, for a readable failure.
        QCOMPARE(scanned->size(), general->size());
        for (qsizetype i = 0; i < scanned->size(); ++i) {
            QVariantMap fast = scanned->at(i).toMap();
            QVariantMap slow = general->at(i).toMap();
            QCOMPARE(fast.take("XML").toString(), slow.take("XML").toString());
            QCOMPARE(fast, slow);
        }
        QCOMPARE(*scanned, *general);
    }

    // nodeToXml writes every node of the replies as QDomNode::save does, up to its bound.
    void nodeToXmlAsSaved_data() { replies_data(); }

    void nodeToXmlAsSaved()
    {
        QFETCH(QString, reply);
        QDomDocument document;
        if (reply.contains(QLatin1String("<!DOCTYPE")) || !document.setContent(reply))
            return;
        QList<QDomNode> nodes = allNodes(document);
        nodes.append(document);
        for (const QDomNode& node : std::as_const(nodes)) {
            const QString written = XmlHelper::nodeToXml(node);
            if (levels(node) > AlarmSearchLimits::MaxDepth)
                QCOMPARE(written, QString());
            else
                QCOMPARE(written, savedByDom(node));
        }
    }

    // The running Qt's attribute order is found by asking its DOM, whichever Qt this was built
    // against: Qt 6.4 writes attributes in its attribute hash's order, Qt 6.8 sorted by name.
    void attributeOrderOfRunningQt()
    {
        using Rule = DomAttributeOrder::Rule;
        const QVersionNumber qt = QLibraryInfo::version();
        if (qt.majorVersion() == 6 && qt.minorVersion() == 4) {
            QCOMPARE(DomAttributeOrder::forDocumentOrder(), Rule::Hash);
            QCOMPARE(DomAttributeOrder::forItemOrder(), Rule::Given);
        } else if (qt >= QVersionNumber(6, 8)) {
            QCOMPARE(DomAttributeOrder::forDocumentOrder(), Rule::ByName);
            QCOMPARE(DomAttributeOrder::forItemOrder(), Rule::ByName);
        } else {
            QSKIP("no known attribute order for this Qt");
        }
    }

    void attributeOrderRule_data()
    {
        QTest::addColumn<QStringList>("saved");
        QTest::addColumn<DomAttributeOrder::Rule>("rule");
        QTest::newRow("by name") << QStringList{"B", "_c", "a", "a0"}
                                 << DomAttributeOrder::Rule::ByName;
        QTest::newRow("as given") << QStringList{"a0", "B", "a", "_c"}
                                  << DomAttributeOrder::Rule::Given;
        QTest::newRow("other") << QStringList{"a", "a0", "B", "_c"}
                               << DomAttributeOrder::Rule::Unknown;
        QTest::newRow("one missing")
            << QStringList{"B", "_c", "a"} << DomAttributeOrder::Rule::Unknown;
    }

    void attributeOrderRule()
    {
        QFETCH(QStringList, saved);
        QFETCH(DomAttributeOrder::Rule, rule);
        QCOMPARE(DomAttributeOrder::ruleFor({"a0", "B", "a", "_c"}, saved, false), rule);
    }

    void nodeToXmlOfBuiltNodes()
    {
        QDomDocument document;
        QDomElement root = document.createElement("R");
        document.appendChild(root);
        root.appendChild(document.createTextNode("a \"q\" < & ]]> \r"));
        root.appendChild(document.createComment("ends with -"));
        root.appendChild(document.createElement("E"));
        root.appendChild(document.createCDATASection("c"));
        root.appendChild(document.createProcessingInstruction("pi", "data"));
        QDomElement qualified = document.createElementNS("urn:x", "p:Q");
        qualified.setAttributeNS("urn:y", "q:a", "1");
        root.appendChild(qualified);
        QDomElement attributes = document.createElement("A");
        for (int i = 0; i < 100; ++i)
            attributes.setAttribute(QStringLiteral("a%1").arg(i), "v\t\n");
        root.appendChild(attributes);
        const QDomText loose = document.createTextNode("loose \"q\"");

        const QList<QDomNode> nodes{document,
                                    root,
                                    root.firstChild(),
                                    qualified,
                                    attributes,
                                    root.childNodes().at(1),
                                    root.childNodes().at(3),
                                    loose};
        for (const QDomNode& node : nodes)
            QCOMPARE(XmlHelper::nodeToXml(node), savedByDom(node));
    }
};

QTEST_GUILESS_MAIN(TestReplyDifferential)
#include "tst_replydifferential.moc"
