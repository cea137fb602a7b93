// The batch's HTML page written from hand-made records: texts from the data
// escaped, failures first, one card per record, thumbnails that decode.
#include "html_report.h"
#include "png_image.h"

#include <gtest/gtest.h>

#include <string_view>

namespace {

using host::ImportRecord;

base::vector<std::uint8_t> unbase64(std::string_view text) {
    constexpr std::string_view digits =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    base::vector<std::uint8_t> out;
    std::uint32_t bits = 0;
    int count = 0;
    for (const char c : text) {
        if (c == '=')
            break;
        const std::size_t value = digits.find(c);
        EXPECT_NE(value, std::string_view::npos) << "not a base64 digit: " << c;
        bits = bits << 6 | std::uint32_t(value);
        if ((count += 6) >= 8) {
            count -= 8;
            out.push_back(std::uint8_t(bits >> count));
        }
    }
    return out;
}

TEST(HtmlReport, Base64MatchesTheStandardVectors) {
    const std::pair<std::string_view, std::string_view> cases[] = {
        {"", ""},
        {"f", "Zg=="},
        {"fo", "Zm8="},
        {"foo", "Zm9v"},
        {"foob", "Zm9vYg=="},
        {"fooba", "Zm9vYmE="},
        {"foobar", "Zm9vYmFy"},
        {"\xff\xfe\xfd", "//79"},
    };
    for (const auto& [plain, encoded] : cases) {
        const auto* bytes = reinterpret_cast<const std::uint8_t*>(plain.data());
        EXPECT_EQ(host::base64({bytes, plain.size()}), encoded) << plain;
    }
}

TEST(HtmlReport, EscapesEveryMarkupCharacter) {
    EXPECT_EQ(host::escapeHtml(R"(<a href="x">'&'</a>)"),
              "&lt;a href=&quot;x&quot;&gt;&#39;&amp;&#39;&lt;/a&gt;");
    EXPECT_EQ(host::escapeHtml("plain äö"), "plain äö");
}

TEST(HtmlReport, PageShowsEveryRecordFailuresFirstWithDecodableThumbnails) {
    host::preview::RgbImage image{3, 2, base::vector<std::uint8_t>(18, 200)};
    base::vector<std::uint8_t> png;
    base::string error;
    ASSERT_TRUE(host::preview::encodePng(image, png, error)) << error;

    base::vector<ImportRecord> records(4);
    records[0].status = "imported";
    records[0].firstWarning = "<b>bold</b> & \"quoted\"";
    records[0].vertices = 12345;
    records[1].status = "crashed";
    records[1].reason = "assimp crashed reading it (<script>alert(1)</script>)";
    records[2].status = "imported";
    records[3].status = "timeout";
    records[3].reason = "gave up";
    const base::vector<base::string> names = {"a<1>.obj", "b&b.ply", "c.stl", "d'.x"};
    const base::vector<base::vector<std::uint8_t>> thumbnails = {png, {}, png, {}};

    const base::string page = host::reportHtml(records, names, thumbnails, 2.5);

    EXPECT_NE(page.find("4 files: 2 imported, 2 failed, 2.5 s"), base::string::npos);
    // Nothing from the data reaches the page as markup.
    for (std::string_view raw : {"<script>", "<b>", "a<1>", "b&b", "d'.x", "\"quoted\""})
        EXPECT_EQ(page.find(raw), base::string::npos) << raw;
    for (std::string_view escaped : {"&lt;script&gt;alert(1)&lt;/script&gt;", "a&lt;1&gt;.obj",
                                     "b&amp;b.ply", "d&#39;.x", "&lt;b&gt;bold&lt;/b&gt; &amp;"})
        EXPECT_NE(page.find(escaped), base::string::npos) << escaped;
    EXPECT_EQ(page.find("<script"), base::string::npos);

    // One card per record; the two failures come first, in input order.
    base::vector<std::size_t> cards;
    for (std::size_t at = 0; (at = page.find("<div class=\"card", at)) != base::string::npos; ++at)
        cards.push_back(at);
    ASSERT_EQ(cards.size(), records.size());
    constexpr std::string_view failedCard = "<div class=\"card failed\">";
    for (std::size_t i = 0; i < cards.size(); ++i)
        EXPECT_EQ(page.compare(cards[i], failedCard.size(), failedCard) == 0, i < 2) << i;
    const auto at = [&](std::string_view text) { return page.find(text); };
    EXPECT_LT(at("b&amp;b.ply"), at("d&#39;.x"));
    EXPECT_LT(at("d&#39;.x"), at("a&lt;1&gt;.obj"));
    EXPECT_LT(at("a&lt;1&gt;.obj"), at("c.stl"));

    // Each image is a data URI holding the PNG given, byte for byte.
    constexpr std::string_view prefix = "src=\"data:image/png;base64,";
    std::size_t images = 0;
    for (std::size_t from = 0; (from = page.find(prefix, from)) != base::string::npos; ++images) {
        from += prefix.size();
        const std::size_t end = page.find('"', from);
        const base::vector<std::uint8_t> bytes = unbase64(page.substr(from, end - from));
        EXPECT_EQ(bytes, png);
        host::preview::RgbImage decoded;
        EXPECT_TRUE(host::preview::decodePng(bytes, decoded, error)) << error;
        EXPECT_EQ(decoded.width, 3u);
    }
    EXPECT_EQ(images, 2u);
    EXPECT_NE(page.find("no picture"), base::string::npos);
}

} // namespace
