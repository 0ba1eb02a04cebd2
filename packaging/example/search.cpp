// The README's first client in C++.
#include <iostream>

#include "CoreTavrin/TAVClient.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"

int main()
{
    const auto client = tavrin::TAVClient::connect();
    if (!client || !(*client)->configure({"com.example.first", "First/1"})) return 1;
    const auto search =
        tavrin::TAVSearchRequest::searchRequestWithString("weather", tavrin::StartSearchTrigger::NewCharacter);
    search->queryId = 1;
    const auto answer = (*client)->request(*search);
    if (!answer || !answer->reply || !answer->reply->rawResponse) return 1;
    std::cout << answer->reply->rawResponse->view() << '\n'; // the service's JSON
}
