// The document model: values built from the parser's pieces, error texts,
// the navigation cursors, fragments and well-formed serialisation.
#include "kshxmlxp.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>

#include "ras1/ras1.h"

namespace {

std::unique_ptr<KSH_XML> parsed(const std::string& text, int expectRc = 0) {
    auto doc = std::make_unique<KSH_XML>();
    EXPECT_EQ(doc->parseMessage(text.data(), (unsigned)text.size()), expectRc) << text;
    return doc;
}

std::string value(KSH_DOMNode* n) { return n && n->getValue() ? std::string(n->getValue(), n->getValueLength()) : "<none>"; }

std::string serialised(KSH_XML& doc, KSH_DOMNode* node) {
    char* text = nullptr;
    unsigned len = 0;
    int rc = doc.extractMessage(node, &text, &len);
    if (rc != 0) return "<rc " + std::to_string(rc) + ">";
    EXPECT_EQ(strlen(text), len);
    return std::string(text, len);
}

const char* kTable =
    "<TABLE name='T'>"
    "<OBJECT>O4SRV.TSITDESC</OBJECT>"
    "<DATA>"
    "<ROW><SITNAME>one</SITNAME><PDT>*IF a</PDT></ROW>"
    "<ROW><SITNAME>two</SITNAME><PDT></PDT></ROW>"
    "<ROW><SITNAME>three</SITNAME></ROW>"
    "</DATA>"
    "<OTHER><ROW><SITNAME>elsewhere</SITNAME></ROW></OTHER>"
    "</TABLE>";

}  // namespace

TEST(XmlParse, ValuesKeepInnerWhiteSpaceAndDropWhiteSpaceAroundElements) {
    auto doc = parsed(
        "<A>\n"
        "  <S> x </S>\n"
        "  <E> \n\t </E>\n"
        "  <M>line one\nline two\r\n\n  line four</M>\n"
        "  <R>a&amp;b&#10;c &lt; d</R>\n"
        "  <P>\nlead and trail\n</P>\n"
        "  <B>1</B>2\n"
        "</A>");
    KSH_DOMNode* a = doc->getRoot();
    ASSERT_NE(a, nullptr);
    EXPECT_EQ(value(a), "<none>");  // white space between elements is dropped
    EXPECT_EQ(a->getNumChildren(), 6u);
    KSH_DOMNode* s = a->getFirstChild();
    EXPECT_EQ(value(s), " x ");
    KSH_DOMNode* e = a->getNextChild();
    EXPECT_EQ(e->getValue(), nullptr);
    EXPECT_EQ(e->getValueLength(), 0u);
    EXPECT_EQ(value(a->getNextChild()), "line one\nline two\n\n  line four");
    EXPECT_EQ(value(a->getNextChild()), "a&b\nc < d");
    EXPECT_EQ(value(a->getNextChild()), "lead and trail");
    // Text after a child's end tag goes to the element started last.
    KSH_DOMNode* b = a->getNextChild();
    EXPECT_EQ(value(b), "12");
    EXPECT_EQ(a->getNextChild(), nullptr);
    EXPECT_EQ(b->getParent(), a);
    EXPECT_EQ(a->getParent(), nullptr);
}

TEST(XmlParse, LongValuesBuiltFromManyPiecesArriveWhole) {
    // Many references make many pieces; the value grows well past the size
    // kept with the nodes and must still be exact, with its line breaks.
    std::string text = "<R><big>";
    std::string expect;
    for (int i = 0; i < 400; ++i) {
        text += "part" + std::to_string(i) + "&amp;&lt;\n";
        expect += "part" + std::to_string(i) + "&<\n";
    }
    text += "end</big><next>n</next></R>";
    expect += "end";
    auto doc = parsed(text);
    KSH_DOMNode* big = doc->getRoot()->getFirstChild();
    ASSERT_NE(big, nullptr);
    EXPECT_EQ(value(big), expect);
    EXPECT_EQ(big->getValueLength(), expect.size());
    EXPECT_EQ(value(doc->getRoot()->getNextChild()), "n");
    std::string out = serialised(*doc, big);
    auto again = parsed(out);
    EXPECT_EQ(value(again->getRoot()), expect);
}

TEST(XmlParse, AttributesKeepOrderAndTheRootNameIsTheFirstElement) {
    auto doc = parsed("<?xml version='1.0'?><soap:Envelope z='1' a=\"2\" m='&quot;3'><b k='v'/></soap:Envelope>");
    EXPECT_STREQ(doc->getRootName(), "soap:Envelope");
    KSH_DOMNode* root = doc->getRoot();
    ASSERT_EQ(root->getAttributeCount(), 3u);
    char* n;
    char* v;
    std::string seen;
    while (root->getNextAttribute(&n, &v) == 0) seen += std::string(n) + "=" + v + ";";
    EXPECT_EQ(seen, "z=1;a=2;m=\"3;");
    // After the end the walk starts over; a reset does the same mid-walk.
    EXPECT_EQ(root->getNextAttribute(&n, &v), 0);
    EXPECT_STREQ(n, "z");
    root->resetAttributeListIter();
    EXPECT_EQ(root->getNextAttribute(&n, &v), 0);
    EXPECT_STREQ(n, "z");
    KSH_DOMNode* b = root->getFirstChild();
    EXPECT_EQ(b->getNextAttribute(&n, &v), 0);
    EXPECT_EQ(b->getNextAttribute(&n, &v), 5);
    EXPECT_EQ(root->getAttribute("a", &v), 0);
    EXPECT_STREQ(v, "2");
    EXPECT_EQ(root->getAttribute("A", &v), 5);  // attribute names are exact

    doc->setRootName(nullptr);
    EXPECT_STREQ(doc->getRootName(), "soap:Envelope");
    doc->setRootName("other");
    EXPECT_STREQ(doc->getRootName(), "other");
}

TEST(XmlParse, ErrorsGiveParserPositionOrTheOpenElement) {
    auto mismatched = parsed("<A>\n  <B></A>", 6);
    ASSERT_NE(mismatched->getParseError(), nullptr);
    EXPECT_STREQ(mismatched->getParseError(), "2:7: mismatched tag\n");
    // What was built before the error stays.
    EXPECT_EQ(mismatched->testElement("B"), 0);

    auto open = parsed("<A><B>text", 6);
    EXPECT_STREQ(open->getParseError(), "no ending tag for tag name \"B\"");

    auto empty = parsed("", 6);
    EXPECT_STREQ(empty->getParseError(), "1:0: no element found\n");

    auto good = parsed("<A/>");
    EXPECT_EQ(good->getParseError(), nullptr);

    // A tag name too long for the error text is cut at a character boundary.
    std::string longName = "N";
    for (int i = 0; i < 400; ++i) longName += "\xC3\xA9";  // two-byte characters
    auto cut = parsed("<" + longName + ">", 6);
    ASSERT_NE(cut->getParseError(), nullptr);
    std::string err = cut->getParseError();
    EXPECT_LT(err.size(), 512u);
    EXPECT_EQ(err.rfind("no ending tag for tag name \"N\xC3\xA9", 0), 0u);
    EXPECT_EQ(err.substr(err.size() - 4), "...\"");
    std::string shown = err.substr(28, err.size() - 28 - 4);
    EXPECT_EQ(shown.size() % 2, 1u);  // "N" and whole two-byte characters only
}

TEST(XmlParse, ADocumentRefusesMoreThan65535ElementsInsteadOfWrapping) {
    std::string text = "<R>";
    for (int i = 0; i < 65535; ++i) text += "<e/>";
    text += "</R>";
    auto doc = parsed(text, 7);
    ASSERT_NE(doc->getParseError(), nullptr);
    EXPECT_STREQ(doc->getParseError(), "more than 65535 elements");

    std::string fits = "<R>";
    for (int i = 0; i < 65534; ++i) fits += "<e/>";
    fits += "</R>";
    auto ok = parsed(fits);
    EXPECT_EQ(ok->getRoot()->getNumChildren(), 65534u);
}

TEST(XmlParse, PasswordValuesNeverReachTheTrace) {
    char path[] = "/tmp/kshxmlxp-trace-XXXXXX";
    int fd = mkstemp(path);
    ASSERT_GE(fd, 0);
    close(fd);
    RAS1_Configure("kshxmlxp:STATE", path);
    {
        auto doc = parsed(
            "<login user='u' Password='attr-secret'><userid>admin</userid><password>s3cr&amp;et</password>"
            "<newPassword>other-secret</newPassword></login>");
        char* text;
        unsigned len;
        ASSERT_EQ(doc->extractDocumentXML(&text, &len), 0);
        // The document itself keeps the password.
        EXPECT_NE(std::string(text).find("<password>s3cr&amp;et</password>"), std::string::npos);
    }
    RAS1_Configure("", "");
    std::ifstream in(path);
    std::stringstream ss;
    ss << in.rdbuf();
    std::string trace = ss.str();
    unlink(path);
    EXPECT_EQ(trace.find("s3cr"), std::string::npos) << trace;
    EXPECT_EQ(trace.find("secret"), std::string::npos) << trace;
    EXPECT_NE(trace.find("\"password\" set to \"xxxxxxx\" "), std::string::npos);
    EXPECT_NE(trace.find("\"userid\" set to \"admin\""), std::string::npos);
    EXPECT_NE(trace.find("Nodename: \"login\" (\"login\")"), std::string::npos);
    EXPECT_NE(trace.find("XML:"), std::string::npos);
    EXPECT_NE(trace.find("<password>xxxxxxx</password>"), std::string::npos);
}

TEST(XmlNavigate, FirstAndNextChildWalkFromTheRootAndStartOverAfterTheEnd) {
    auto doc = parsed("<R><a>1</a><b>2</b></R>");
    EXPECT_EQ(doc->getNextChild(), nullptr);  // no walk yet
    KSH_DOMNode* r = doc->getFirstChild();
    ASSERT_NE(r, nullptr);
    EXPECT_STREQ(r->getName(), "R");
    EXPECT_EQ(doc->getCurrent(), r);
    KSH_DOMNode* a = doc->getFirstChild();
    ASSERT_NE(a, nullptr);
    EXPECT_STREQ(a->getName(), "a");
    EXPECT_STREQ(doc->getNextChild()->getName(), "b");
    EXPECT_EQ(doc->getNextChild(), nullptr);
    EXPECT_EQ(doc->getCurrent(), nullptr);
    EXPECT_STREQ(doc->getNextChild()->getName(), "a");

    // A leaf has no first child: null, and current stays on it.
    EXPECT_EQ(doc->getFirstChild(), nullptr);
    char* name;
    ASSERT_EQ(doc->getNodeTagname(&name), 0);
    EXPECT_STREQ(name, "a");
    char* v;
    unsigned len;
    EXPECT_EQ(doc->getNodeValue(&v, &len), 0);
    EXPECT_EQ(std::string(v, len), "1");
    doc->resetCurrentNode();
    EXPECT_EQ(doc->getNodeTagname(&name), 5);
    EXPECT_EQ(doc->getNodeValue(&v, &len), 5);
    EXPECT_EQ(doc->getAttributeList(), 5);
    EXPECT_EQ(doc->getFirstChild(), r);  // without current: the root again
}

TEST(XmlNavigate, ArraysAreTheSiblingsOfTheFirstMatchAndWalkIndependentlyOfChildWalks) {
    auto doc = parsed(kTable);
    unsigned n = 99;
    ASSERT_EQ(doc->getArray("ROW", &n), 0);
    EXPECT_EQ(n, 3u);  // the ROW under OTHER is not counted
    std::string names;
    for (unsigned i = 0; i < n; ++i) {
        ASSERT_NE(doc->getCurrent(), nullptr);
        // Walk the entry's children; the array position is not disturbed.
        for (KSH_DOMNode* c = doc->getFirstChild(); c; c = doc->getNextChild()) names += value(c) + ",";
        names += "|";
        EXPECT_EQ(doc->nextNode(), i + 1 < n ? 0 : 5);
    }
    EXPECT_EQ(names, "one,*IF a,|two,<none>,|three,|");
    EXPECT_EQ(doc->getCurrent(), nullptr);
    ASSERT_EQ(doc->nextNode(), 0);  // starts over at the first entry
    char* v;
    unsigned len;
    EXPECT_EQ(doc->getElementValue("SITNAME", &v, &len, nullptr, doc->getCurrent()), 0);
    EXPECT_EQ(std::string(v, len), "one");

    EXPECT_EQ(doc->getArray("NOPE", &n), 5);
    EXPECT_EQ(n, 0u);
    EXPECT_EQ(doc->nextNode(), 5);

    // The root as array: an array of itself.
    ASSERT_EQ(doc->getArray("TABLE", &n), 0);
    EXPECT_EQ(n, 1u);
    EXPECT_STREQ(doc->getCurrent()->getName(), "TABLE");

    // Immediate arrays: among the children of the given node or of current.
    ASSERT_EQ(doc->testElement("OTHER"), 0);
    KSH_DOMNode* other = doc->getCurrent();
    ASSERT_EQ(doc->getArrayImmediate("ROW", &n, nullptr), 0);
    EXPECT_EQ(n, 1u);
    EXPECT_EQ(doc->getCurrent()->getParent(), other);
    ASSERT_EQ(doc->testElement("DATA"), 0);
    EXPECT_EQ(doc->getArrayImmediate("ROW", &n, doc->getCurrent()), 0);
    EXPECT_EQ(n, 3u);
    EXPECT_EQ(doc->getArrayImmediate("SITNAME", &n, other), 5);
    EXPECT_EQ(n, 0u);
    EXPECT_EQ(doc->getCurrent(), nullptr);
    EXPECT_EQ(doc->getArrayImmediate("ROW", &n, nullptr), 5);  // no parent, no current
}

TEST(XmlNavigate, ElementLookupStopsAtTheFirstMatchAndHonoursTheParent) {
    auto doc = parsed(
        "<R><E/><E>later</E><K><E>inner</E><V>kv</V></K><V attr='x'>top</V></R>");
    char* v = nullptr;
    unsigned len = 0;
    char* tag = nullptr;
    // The first E is empty: 5, even though a later E has a value.
    EXPECT_EQ(doc->getElementValue("E", &v, &len, &tag), 5);
    EXPECT_STREQ(tag, "E");
    EXPECT_EQ(doc->getCurrent(), nullptr);  // left alone on 5
    EXPECT_EQ(doc->testElement("E"), 0);
    EXPECT_STREQ(doc->getCurrent()->getName(), "E");
    EXPECT_EQ(doc->testElement("missing"), 5);

    ASSERT_EQ(doc->testElement("K"), 0);
    KSH_DOMNode* k = doc->getCurrent();
    EXPECT_EQ(doc->getElementValue("E", &v, &len, nullptr, k), 0);
    EXPECT_EQ(std::string(v, len), "inner");
    EXPECT_EQ(doc->getElementValue("V", &v, &len, nullptr, doc->getRoot()), 0);
    EXPECT_EQ(std::string(v, len), "top");
    EXPECT_EQ(doc->getAttributeList(), 0);
    char* an;
    char* av;
    EXPECT_EQ(doc->getNextAttribute(&an, &av), 0);
    EXPECT_STREQ(av, "x");
    EXPECT_EQ(doc->getAttribute("attr", &av), 0);
    EXPECT_EQ(doc->getElementValue("V", &v, &len, nullptr, nullptr), 5);  // parent null: the root only
    EXPECT_EQ(doc->getElementValue("R", nullptr, nullptr, nullptr, nullptr), 0);

    // testElementImmediate looks among the children of current (root if none).
    doc->resetCurrentNode();
    EXPECT_EQ(doc->testElementImmediate("K"), 0);
    EXPECT_EQ(doc->testElementImmediate("V"), 0);  // K's child V
    EXPECT_STREQ(doc->getCurrent()->getParent()->getName(), "K");
    EXPECT_EQ(doc->testElementImmediate("E"), 5);
}

TEST(XmlSerialise, WritesStartTagsValuesChildrenAndEndTagsAsWellFormedXml) {
    auto doc = parsed("<E a='1' b=\"2\">v<X/><Y>y</Y></E>");
    EXPECT_EQ(serialised(*doc, doc->getRoot()), "<E a=\"1\" b=\"2\">v<X></X><Y>y</Y></E>");
    EXPECT_EQ(serialised(*doc, nullptr), "<rc 5>");

    // A serialisation longer than the text parsed still fits its buffer.
    auto tiny = parsed("<a/>");
    EXPECT_EQ(serialised(*tiny, tiny->getRoot()), "<a></a>");

    // Special characters come back as references, and the result reparses
    // to the same values.
    auto special = parsed(
        "<V q='a&amp;b &lt; &quot;c&quot; &gt; d&#10;e&#9;f&#13;'>1 &lt; 2 &amp;&amp; 3 &gt; 2 ]]&gt; x&#13;y</V>");
    std::string out = serialised(*special, special->getRoot());
    EXPECT_EQ(out,
              "<V q=\"a&amp;b &lt; &quot;c&quot; > d&#10;e&#9;f&#13;\">"
              "1 &lt; 2 &amp;&amp; 3 &gt; 2 ]]&gt; x&#13;y</V>");
    auto again = parsed(out);
    char* q;
    ASSERT_EQ(again->getRoot()->getAttribute("q", &q), 0);
    EXPECT_STREQ(q, "a&b < \"c\" > d\ne\tf\r");
    EXPECT_EQ(value(again->getRoot()), "1 < 2 && 3 > 2 ]]> x\ry");

    // Blanks at the ends of a value with special characters survive the
    // round trip (escaped, they would come back as white-space-only pieces).
    auto edges = parsed(
        "<S><c><![CDATA[  <x> & ]]></c><g>\t]] a > b</g><t><![CDATA[x ]]]]><![CDATA[> ]]></t><o><![CDATA[ & ]]></o><p>a&#13; b</p></S>");
    std::string edgeText = serialised(*edges, edges->getRoot());
    EXPECT_EQ(edgeText,
              "<S><c><![CDATA[  <]]>x&gt; <![CDATA[& ]]></c><g>\t]] a &gt; b</g><t>x ]]<![CDATA[> ]]></t>"
              "<o><![CDATA[ & ]]></o><p>a&#13; b</p></S>");
    auto edgesAgain = parsed(edgeText);
    KSH_DOMNode* e = edgesAgain->getRoot()->getFirstChild();
    for (const char* want : {"  <x> & ", "\t]] a > b", "x ]]> ", " & ", "a\r b"}) {
        ASSERT_NE(e, nullptr);
        EXPECT_EQ(value(e), want);
        e = edgesAgain->getRoot()->getNextChild();
    }

    // The steps on their own: a name, a value with its leading blank.
    char buf[64];
    char* p = buf;
    KSH_XML::insertTagname(again->getRoot(), &p);
    KSH_XML::insertNodeValue(again->getRoot(), &p, true);
    EXPECT_EQ(std::string(buf, (size_t)(p - buf)), "V 1 &lt; 2 &amp;&amp; 3 &gt; 2 ]]&gt; x&#13;y");
    p = buf;
    KSH_XML::insertNodeValue(tiny->getRoot(), &p, true);
    EXPECT_EQ(p, buf);  // no value: nothing, not even the blank

    // extractChildNodeXML: the first child of current (the root without one).
    auto table = parsed(kTable);
    ASSERT_EQ(table->testElement("ROW"), 0);
    char* text;
    unsigned len;
    ASSERT_EQ(table->extractChildNodeXML(&text, &len), 0);
    EXPECT_STREQ(text, "<SITNAME>one</SITNAME>");
}

TEST(XmlSerialise, FragmentsCopyASubtreeAndLiveWithTheirDocument) {
    auto doc = parsed(kTable);
    ASSERT_EQ(doc->testElement("DATA"), 0);
    KSH_XML* frag = doc->createFragment(nullptr);
    ASSERT_NE(frag, nullptr);
    EXPECT_STREQ(frag->getRootName(), "DATA");
    char* a;
    unsigned al;
    ASSERT_EQ(frag->extractDocumentXML(&a, &al), 0);
    std::string fromFragment(a, al);
    EXPECT_EQ(fromFragment, serialised(*doc, doc->getCurrent()));
    EXPECT_EQ(fromFragment.rfind("<DATA><ROW><SITNAME>one</SITNAME><PDT>*IF a</PDT></ROW>", 0), 0u);
    // The copy is independent: the fragment's array walks its own nodes.
    unsigned n;
    ASSERT_EQ(frag->getArray("ROW", &n), 0);
    EXPECT_EQ(n, 3u);
    EXPECT_NE(frag->getCurrent(), nullptr);

    // A fragment of the root's first child; a fragment of a fragment.
    doc->resetCurrentNode();
    doc->getFirstChild();  // current = root
    KSH_XML* child = doc->createChildFragment();
    ASSERT_NE(child, nullptr);
    EXPECT_STREQ(child->getRootName(), "OBJECT");
    ASSERT_EQ(frag->testElement("PDT"), 0);
    KSH_XML* inner = frag->createFragment(frag->getCurrent());
    ASSERT_NE(inner, nullptr);
    EXPECT_EQ(serialised(*inner, inner->getRoot()), "<PDT>*IF a</PDT>");
    doc->resetCurrentNode();
    EXPECT_EQ(doc->createFragment(nullptr), nullptr);
}

TEST(XmlSerialise, DeepNestingIsCopiedAndWrittenWithoutRecursion) {
    const int depth = 60000;
    std::string text;
    for (int i = 0; i < depth; ++i) text += "<d>";
    text += "x";
    for (int i = 0; i < depth; ++i) text += "</d>";
    auto doc = parsed(text);
    char* out;
    unsigned len;
    ASSERT_EQ(doc->extractDocumentXML(&out, &len), 0);
    EXPECT_EQ(std::string(out, len), text);
    KSH_XML* frag = doc->createFragment(doc->getRoot());
    ASSERT_NE(frag, nullptr);
    ASSERT_EQ(frag->extractDocumentXML(&out, &len), 0);
    EXPECT_EQ(len, text.size());
}
