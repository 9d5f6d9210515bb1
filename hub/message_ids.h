#ifndef HUB_MESSAGE_IDS_H_
#define HUB_MESSAGE_IDS_H_

namespace vesk {

/// What the payload of an event is.
enum MessageId : int {
  kPhysicalConfigEvent = 768,  // sns_std_sensor_physical_config_event
  kProximityEvent = 769,       // sns_proximity_event
  kActivityEvent = 778,        // sns_activity_event
  kInactivityEvent = 779,      // sns_inactivity_event
  kSensorEvent = 1025,         // sns_std_sensor_event
  kVsyncEvent = 1041,          // sns_camera_vsync_interrupt_info
};

}  // namespace vesk

#endif  // HUB_MESSAGE_IDS_H_
