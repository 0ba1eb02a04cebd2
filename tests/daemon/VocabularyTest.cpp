#include <gtest/gtest.h>

#include "CoreTavrin/ClientVocabulary.h"

namespace tavrin {
namespace {

TEST(Vocabulary, ParsesAndPrintsWithItsAsymmetries)
{
    const std::pair<OptionalText, FeatureType> features[]{
        {"domain", FeatureType::Domain},       {"tld", FeatureType::Domain},   {"MediaType", FeatureType::MediaType},
        {"MEDIATYPE", FeatureType::MediaType}, {"mt", FeatureType::MediaType}, {"MT", FeatureType::Unknown},
        {"Domain", FeatureType::Unknown},      {"topic", FeatureType::Topic},  {"", FeatureType::Unknown},
        {std::nullopt, FeatureType::Unknown}};
    for (const auto& [text, type] : features) EXPECT_EQ(featureTypeFromString(text), type) << text.value_or("none");

    EXPECT_EQ(stringFromFeatureType(FeatureType::MediaType), "mediaType");
    EXPECT_EQ(stringFromFeatureType(FeatureType::Unknown), "unkonwn");
    EXPECT_EQ(stringFromFeatureType(static_cast<FeatureType>(7)), "unkonwn");
    EXPECT_EQ(stringFromResultPlacement(ResultPlacement::Unknown), "unkonw");
    EXPECT_EQ(stringFromResultPlacement(static_cast<ResultPlacement>(5)), "unkonw");
    EXPECT_EQ(resultPlacementFromString(std::nullopt), ResultPlacement::Unknown);
    EXPECT_EQ(stringFromFunctionType(funcTypeFromString("engrate")), "eng/render");
    EXPECT_EQ(funcTypeFromString("ENG"), FunctionType::Unknown);
    EXPECT_EQ(stringFromClientType(clientTypeFromString("Wendral")), "unknown");
}

TEST(Vocabulary, NamesTheClientFirstInListOrder)
{
    EXPECT_EQ(extractClientNameFromString("com.quorvane.KIVO"), "kivo");
    EXPECT_EQ(extractClientNameFromString("vistrel and Wendral"), "wendral");
    EXPECT_EQ(extractClientNameFromString("tavrind/1 lookup"), "lookup");
    EXPECT_EQ(extractClientNameFromString(""), std::nullopt);
    EXPECT_EQ(extractClientNameFromString(std::nullopt), std::nullopt);

    EXPECT_EQ(getClientFromUserAgent("Vistrel/4 like Wendral"), "wendral");
    EXPECT_EQ(getClientFromUserAgent("news/1"), "unknown");
    EXPECT_EQ(getClientFromUserAgent(std::nullopt), "unknown");
}

} // namespace
} // namespace tavrin
