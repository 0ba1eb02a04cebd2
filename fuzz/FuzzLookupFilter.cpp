#include "CoreTavrin/TAVRequest.h"
#include "fuzz/Check.h"
#include "platform/values/Json.h"
#include "tavrind/Lookup.h"

/// The input is the text around a word, and from the second line on a lookup's answer. Filtering drops results, in
/// order, and changes nothing else; once filtered it stays as it is.
void runInput(std::string_view input)
{
    tavrin::TAVLookupRequest request;
    request.queryContext = std::string(takeLine(input));
    auto response = platform::parseJson(input);
    if (!response) return;

    const platform::Value before = *response;
    tavrin::Lookup::filterLookupResultsWithRequest(request, *response, "de_CH");
    check(response->count() == before.count());
    for (std::size_t i = 0; i < before.count(); ++i) {
        const platform::Value& kept = (*response)[i]["results"];
        std::size_t from = 0;
        for (std::size_t k = 0; k < kept.count(); ++k, ++from)
            while (!(before[i]["results"][from] == kept[k])) check(++from < before[i]["results"].count());
    }
    const platform::Value once = *response;
    tavrin::Lookup::filterLookupResultsWithRequest(request, *response, "de_CH");
    check(*response == once);
}
