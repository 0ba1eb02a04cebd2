#include "fuzz/Sessions.h"
#include "platform/files/Counters.h"
#include "platform/run/Transactions.h"
#include "platform/values/Archive.h"
#include "platform/values/Record.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/FileContainer.h"
#include "tavrind/TavrinDiagnosticDataReporter.h"
#include "tavrind/TavrinFeedback.h"
#include "tests/support/ByHand.h"
#include "tests/support/Encodings.h"
#include "tests/support/MemoryFiles.h"

using namespace tavrin;
using platform::test::framed;

namespace {

constexpr const char* kFile = "/session.1";

/// Reads a file that an earlier process left, as it is found, and checks what is made of it.
void readFile(std::string contents)
{
    platform::test::ByHand thread;
    platform::test::MemoryFiles files;
    platform::Transactions transactions;
    platform::CounterStore counters;
    TavrinDiagnosticDataReporter diagnosticData(counters);
    const auto queue = thread.makeQueue("storage");
    const auto store = std::make_shared<const FileContainerStore>(
        FileContainerStore{files, transactions, diagnosticData, queue, "tavrind/1", 4u << 20});

    files.files[kFile] = std::move(contents);
    const auto container = std::make_shared<FileContainer>(store, kFile);
    queue->sync([&container] { container->countFeedback(); });
    const auto [session, lost, fate] = container->read();
    const std::size_t events = session ? session->recordedEvents() : 0;
    check(container->feedbackCount() == events + lost, std::to_string(lost));
    if (!session) return;
    for (const auto& event : session->feedbacks()) (void)event->description();
    fuzz::checkUpload(*session);
}

} // namespace

/// The input is a session file; and it is what a file has behind its head, as the archive of one event.
void runInput(std::string_view input)
{
    readFile(std::string(input));
    readFile(framed(platform::archiveValue("tavrind/1")) + framed(platform::archive(ClientSessionHeader())) +
             framed(input));
}
