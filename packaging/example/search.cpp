// Searches for the words of the command line and prints the service's JSON.
#include <cstdio>

#include "CoreTavrin/TAVClient.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"

int main(int argc, char** argv)
{
    using namespace tavrin;
    const auto client = TAVClient::connect();
    if (argc < 2 || !client || !(*client)->configure({"com.example.first", "First/1"})) return 1;
    const auto request = TAVSearchRequest::searchRequestWithString(argv[1], StartSearchTrigger::NewCharacter);
    request->queryId = 1;
    const auto answer = (*client)->request(*request);
    if (!answer || !answer->reply || !answer->reply->rawResponse) return 1;
    std::printf("%s\n", std::string(answer->reply->rawResponse->view()).c_str());
}
