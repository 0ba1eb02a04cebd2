#include "tools/fleet/Assumptions.h"

namespace tavrin::fleet {

std::span<const Assumption> assumptions()
{
    using A = Assumptions;
    static constexpr Assumption kAll[]{
        {"visits-per-day", &A::visitsPerDay, 0.01, 1000, "Visits of a search view a day, mean of all devices"},
        {"activity-spread", &A::activitySpread, 0, 2, "Sigma of the log-normal distribution of devices' visits"},
        {"queries-per-visit", &A::queriesPerVisit, 1, 20, "Queries of the corpus typed in a visit, mean"},
        {"other-per-visit", &A::otherPerVisit, 0, 20, "Zero-keyword searches, cards and more results in a visit, mean"},
        {"lookups-per-day", &A::lookupsPerDay, 0, 1000, "Words looked up in a text a day"},
        {"client-events", &A::clientEventsPerQuery, 0, 1000, "Events that a client reports for a query"},
        {"latency", &A::latency, 0, 10, "Seconds from a search to its response"},
        {"always-on", &A::alwaysOn, 0, 1, "Share of devices that are never off"},
        {"suspends", &A::suspends, 0, 1, "Share of the others that suspend for the night; the rest shuts down"},
        {"metered", &A::meteredShare, 0, 1, "Share of devices on a metered network from about 8 to 18 h"},
        {"offline-days", &A::offlineDays, 0, 1, "Share of days with a spell without network"},
        {"offline-minutes", &A::offlineMinutes, 1, 600, "Length of such a spell, mean"},
        {"crashes-per-day", &A::crashesPerDay, 0, 100, "Restarts of the daemon a day, beside those of the device"},
        {"local-clocks", &A::localHardwareClock, 0, 1, "Share of devices whose hardware clock runs in local time"},
        {"changed-images", &A::changedImages, 0, 1, "Share of images that changed since the device loaded them"},
        {"request-bytes", &A::requestBytes, 0, 1e5, "Bytes of a request on the wire, without a body"},
        {"header-bytes", &A::responseHeaderBytes, 0, 1e5, "Bytes of a response on the wire, without its body"},
        {"compression", &A::answerCompression, 0.01, 1, "Size of a compressed search response over its JSON"},
        {"image-bytes", &A::imageBytes, 0, 1e7, "Bytes of an image"},
        {"bag-bytes", &A::bagBytes, 0, 1e7, "Bytes of a bag"},
        {"resource-bytes", &A::resourceBytes, 0, 1e9, "Bytes of a resource"},
        {"upload-bytes", &A::uploadBytes, 0, 1e6, "Bytes of an upload's body without events"},
        {"event-bytes", &A::eventBytes, 0, 1e4, "Bytes of each event in an upload's body, compressed"},
        {"failure-seconds", &A::failureSeconds, 0.001, 300, "Seconds until a request to a dead service fails"},
    };
    return kAll;
}

} // namespace tavrin::fleet
