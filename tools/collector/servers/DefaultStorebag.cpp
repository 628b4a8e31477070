#include "tools/collector/servers/StorebagServer.h"

namespace orvanta::collector {

std::string_view defaultStorebagJson() {
  return R"JSON({
  "version": "1.0.0",
  "refresh_cycle": 60,
  "development": {
    "http_post": {
      "display_url": "${http}/events",
      "clients": [
        {
          "client": "demo",
          "override_dnu": 1,
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        },
        {
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        }
      ]
    },
    "upload_server": {"post_url": "${https}/upload", "display_url": "${http}/uploads"},
    "dashboard": {
      "ip": "127.0.0.1",
      "port": "${dashboard_port}",
      "reliable": 500,
      "display_url": "${http}/datagrams",
      "post_url": "${https}/logdata"
    }
  },
  "kovalt_internal": {
    "http_post": {
      "display_url": "${http}/events",
      "clients": [
        {
          "client": "demo",
          "override_dnu": 1,
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [
            {"key": "userName", "action": "remove"},
            {"key": "accountID", "action": "sha256"}
          ],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        },
        {
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [
            {"key": "userName", "action": "remove"},
            {"key": "accountID", "action": "sha256"}
          ],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        }
      ]
    },
    "upload_server": {"post_url": "${https}/upload", "display_url": "${http}/uploads"},
    "dashboard": {
      "ip": "127.0.0.1",
      "port": "${dashboard_port}",
      "reliable": 500,
      "display_url": "${http}/datagrams",
      "post_url": "${https}/logdata"
    }
  },
  "seed": {
    "http_post": {
      "display_url": "${http}/events",
      "clients": [
        {
          "client": "demo",
          "override_dnu": 1,
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [
            {"key": "userName", "action": "remove"},
            {"key": "accountID", "action": "sha256"}
          ],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        },
        {
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [
            {"key": "userName", "action": "remove"},
            {"key": "accountID", "action": "sha256"}
          ],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        }
      ]
    },
    "upload_server": {"post_url": "${https}/upload", "display_url": "${http}/uploads"}
  },
  "release": {
    "http_post": {
      "display_url": "${http}/events",
      "clients": [
        {
          "client": "demo",
          "override_dnu": 1,
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [
            {"key": "userName", "action": "remove"},
            {"key": "accountID", "action": "sha256"}
          ],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        },
        {
          "locale_whitelist": [
            "AT", "AU", "BE", "BR", "CA", "CH", "CN", "DE", "DK", "ES", "FI", "FR", "GB", "IE",
            "IN", "IT", "JP", "KR", "MX", "NL", "NO", "NZ", "PL", "PT", "SE", "US"
          ],
          "sampling_threshold": 1,
          "filters": [
            {"key": "userName", "action": "remove"},
            {"key": "accountID", "action": "sha256"}
          ],
          "post_url": "${https}/events",
          "realtime_post_url": "${https}/events/realtime",
          "event_threshold": 49
        }
      ]
    },
    "upload_server": {"post_url": "${https}/upload", "display_url": "${http}/uploads"}
  }
}
)JSON";
}

}  // namespace orvanta::collector
