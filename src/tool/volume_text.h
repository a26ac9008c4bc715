// The volume in words: the first lines of info, its JSON members, partitions and raw headers.
#pragma once

#include <string>

#include "hfs/records/json_writer.h"
#include "tool/session.h"

namespace VELK::tool {

// Three or four lines about the volume.
std::string VolumeText(Session* session);
// The same as members of the open object.
void VolumeMembers(Session* session, JsonWriter* json);
// What lies in the image, and why it was taken or left. Opens the image itself: there need not be
// a volume in it.
void PrintPartitions(Invocation* call);
// The volume header and the header record of each tree, byte by byte.
void PrintHeaders(Session* session, Invocation* call);

}  // namespace VELK::tool
