#ifndef HUB_VESK_H_
#define HUB_VESK_H_

// The interface of the hub's client library, whole. What has no body in these
// headers is defined by the library that is linked.

#include "hub/client.h"
#include "hub/connection.h"
#include "hub/log.h"
#include "hub/message_ids.h"
#include "hub/sensor_uid.h"
#include "hub/sns_messages.pb.h"
#include "hub/utilities.h"

#endif  // HUB_VESK_H_
