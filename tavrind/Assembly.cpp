#include "tavrind/Assembly.h"

#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "tavrind/QueueRanks.h"

namespace tavrin {

Assembly::Assembly(platform::Device& device_)
    : device(device_), diagnosticData(device_.counters),
      feedbackBooks(
          device_.files, device_.directories.state / "com.quorvane.tavrind" / "feedback-books.json",
          device_.serialQueue("com.quorvane.tavrind.feedbackBooks", rank::kRoot, platform::Priority::Background)),
      userDefaults(device_.userDefaults), fileManager(device_.files), notificationCenter(device_.notifications),
      dateQueue(device_.serialQueue("com.quorvane.tavrind.firstUseQueue", rank::kStore)),
      sharedSession(device_.userDefaults.boolean("TAVSharedSession"))
{}

Assembly::~Assembly() = default;

} // namespace tavrin
