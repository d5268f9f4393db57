#include "stdafx.h"

#include "NotificationListener.h"

#include "PhotoDB.h"
#include "State.h"
#include "StateMachine.h"
#include "VolumeInfoManager.h"

#include "orvautil/ClientSocket.h"
#include "orvautil/Core.h"
#include "orvautil/Decodestring.h"
#include "orvautil/Xml.h"

#include <xercesc/dom/DOMNode.hpp>
#include <xercesc/util/PlatformUtils.hpp>

#include <sys/statvfs.h>

#include <array>
#include <cstdint>

namespace orva::dbmerger {

namespace {

/// The XML platform for a scope.
class XMLPlatform {
public:
  XMLPlatform() { xercesc::XMLPlatformUtils::Initialize(); }
  XMLPlatform(const XMLPlatform&) = delete;
  XMLPlatform& operator=(const XMLPlatform&) = delete;
  ~XMLPlatform() { xercesc::XMLPlatformUtils::Terminate(); }
};

using Handler = void (State::*)(VolumeInfo);

/// Fills in the size of a plugged volume. If the size cannot be determined, the record keeps the
/// default size, which no election accepts.
void MeasureVolume(VolumeInfo& volume) {
  struct statvfs status {};
  if (statvfs(volume.mountPoint.c_str(), &status) != 0) {
    return;
  }
  volume.capacity = static_cast<double>(std::uint64_t{status.f_blocks} * status.f_frsize);
  // The free blocks are multiplied by the other block size: kept for compatibility.
  volume.used =
      volume.capacity - static_cast<double>(std::uint64_t{status.f_bfree} * status.f_bsize);
  syslog(LOG_LOCAL1 | LOG_INFO,
         "The volume is plugged and capacity is %lf and capacity_used is %lf for mountPoint %s",
         volume.capacity, volume.used, volume.mountPoint.c_str());
}

/// The text of a batch's last "profile" child; empty when there is none.
std::string LastProfile(const xercesc::DOMNode& root) {
  std::string profile;
  for (const xercesc::DOMNode* child = root.getFirstChild(); child != nullptr;
       child = child->getNextSibling()) {
    if (util::XMLCh2string(child->getNodeName()) == "profile") {
      profile = util::XMLCh2string(child->getTextContent());
    }
  }
  return profile;
}

/// Whether a batch is of the accepted profile, which is then logged.
bool IsAcceptedBatch(const xercesc::DOMNode& root) {
  const std::string profile = LastProfile(root);
  if (profile != TRANSCODING_PROFILE) {
    return false;
  }
  syslog(LOG_LOCAL1 | LOG_INFO, "Profile ==> %s ==> \n", profile.c_str());
  return true;
}

/// Logs the kind of event and returns its handler; null when there is nothing to handle.
Handler SelectHandler(const std::string& name, const xercesc::DOMNode& root, VolumeInfo& volume) {
  if (name == "Plugged") {
    MeasureVolume(volume);
    return &State::handleVolumePlugged;
  }
  if (name == "Unplugged") {
    return &State::handleVolumeUnplugged;
  }
  if (name == "Scanned") {
    syslog(LOG_LOCAL1 | LOG_INFO, ":: Scanned");
    return &State::handleVolumeScanned;
  }
  if (name == "TranscodedBatch") {
    syslog(LOG_LOCAL1 | LOG_INFO, ":: Transcodedbatch ");
    return IsAcceptedBatch(root) ? &State::handlePictureTranscoded : nullptr;
  }
  if (name == "End") {
    syslog(LOG_LOCAL1 | LOG_INFO, ":: End ");
    return &State::handlePictureTranscoded;
  }
  if (name == "Purged") {
    syslog(LOG_LOCAL1 | LOG_INFO, ":: Purged ");
    return &State::handleVolumePurged;
  }
  return nullptr;
}

/// What an earlier event that failed has left undone.
State::Unfinished UnfinishedWork() {
  const StateMachine* const machine = StateMachine::instance;
  return machine == nullptr ? State::Unfinished::Nothing
                            : machine->getCurrentState()->getUnfinished();
}

/// Turns a notification into a volume record, updates the registry, completes what an earlier event
/// has left undone, and calls the current state. Throws std::out_of_range when the notification
/// names no mount point, and what the state throws.
void Parsenotification(const xercesc::DOMNode& root) {
  const xercesc::DOMNamedNodeMap* const attributes = root.getAttributes();
  VolumeInfo volume{.mountPoint =
                        util::Decodestring(util::GetAttributeValue("MountPoint", attributes)),
                    .photoDbSize = 1};
  const std::string name = util::GetAttributeValue("Name", attributes);
  if (volume.mountPoint.at(volume.mountPoint.size() - 1) != NATIVE_PATH_SEPARATOR.front()) {
    volume.mountPoint += NATIVE_PATH_SEPARATOR;
  }

  const Handler handler = SelectHandler(name, root, volume);
  if (handler == nullptr) {
    return;
  }
  const bool isUnfinished = UnfinishedWork() != State::Unfinished::Nothing;
  VolumeInfoManager& registry = VolumeInfoManager::Instance();
  if (handler == &State::handleVolumeUnplugged) {
    registry.removeVolumeInfo(volume);
  } else {
    registry.addVolumeInfo(volume);
  }
  StateMachine& machine = StateMachine::Instance();
  if (isUnfinished) {
    machine.getCurrentState()->recover();
  }
  if (State* const state = machine.getCurrentState()) {
    (state->*handler)(volume);
  }
}

} // namespace

void NotificationListener::Run() {
  const XMLPlatform platform;
  while (!stop) {
    // Log readers rely on the name and the number in each of these three lines.
    syslog(LOG_INFO, "%s:%d: Creating the notification socket %s",
           "src/zophotodbmerger/NotificationListener", 130, core::ORVA_NOTIFICATION_SOCKET.c_str());
    util::ClientSocket socket(util::Socket::Address(core::ORVA_NOTIFICATION_SOCKET), false);
    if (!socket.IsOpen()) {
      syslog(LOG_LOCAL1 | LOG_ERR, "Unable to open socket (%s)",
             core::ORVA_NOTIFICATION_SOCKET.c_str());
      break;
    }
    syslog(LOG_INFO, "%s:%d: Calling ReadMessage()", "src/zophotodbmerger/NotificationListener",
           137);
    ReadMessages(socket);
  }
  syslog(LOG_LOCAL1 | LOG_INFO, "%s:%d: NotificationListener exiting.",
         "src/zophotodbmerger/NotificationListener", 154);
}

bool NotificationListener::IsValidMessage(const std::string& message) const {
  return message.find("ORVANotification") != std::string::npos;
}

void NotificationListener::HandleMessage(util::Stream& /*stream*/, const unsigned char* /*data*/,
                                         unsigned long /*length*/,
                                         const xercesc::DOMNode& root) const {
  const std::string name = util::XMLCh2string(root.getNodeName());
  if (name != "ORVANotification") {
    syslog(LOG_LOCAL1 | LOG_ERR, "ERROR ! Node name = %s", name.c_str());
    return;
  }
  try {
    Parsenotification(root);
  } catch (...) {
    ElectAfterFailure();
    throw;
  }
}

void NotificationListener::ElectAfterFailure() const {
  // A transition that failed is repeated only before the next event: the database is probably still
  // locked.
  if (UnfinishedWork() != State::Unfinished::Election) {
    return;
  }
  try {
    StateMachine::Instance().getCurrentState()->recover();
  } catch (...) {
    syslog(LOG_LOCAL1 | LOG_ERR, "MessageProcessor:: %s",
           DescribeException(std::current_exception()).c_str());
  }
}

std::pair<const unsigned char*, unsigned long> NotificationListener::GetDelimiter() const {
  static constexpr std::array<unsigned char, 4> delimiter{0x00, 0x00, 0x00, 0x00};
  return {delimiter.data(), delimiter.size()};
}

std::string NotificationListener::DescribeException(const std::exception_ptr& exception) const {
  try {
    std::rethrow_exception(exception);
  } catch (const PhotoDB::Error& error) {
    return error.Message();
  } catch (...) {
    return MessageProcessor::DescribeException(std::current_exception());
  }
}

} // namespace orva::dbmerger
