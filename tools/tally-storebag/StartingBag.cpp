#include "tally-storebag/StartingBag.h"

namespace tallyd::storebagtool {

std::string_view startingBag() {
  return R"(<?xml version="1.0" encoding="UTF-8"?>
<!--
  A storebag: what the daemon does with the messages of one kind of client.

  Hosts under "example.com" and addresses under 192.0.2 stand for yours. Leave out the backends that you do not
  want: whoever is not listed is not made. "tally-storebag keys" lists every key.
-->
<plist version="1.0">
<dict>
  <!-- Required: without it the daemon ends itself. Session records carry it. -->
  <key>version</key>
  <string>1</string>

  <!-- What customer builds get. "seed", "quillon_internal" and "development" may stand beside it; seed builds
       get "release" when there is no "seed". -->
  <key>release</key>
  <dict>

    <!-- Events as JSON over HTTPS. -->
    <key>splunk</key>
    <dict>
      <!-- The first entry that matches a session's client and service counts, so the general ones come last. -->
      <key>clients</key>
      <array>
        <dict>
          <!-- Client names with commas between them, matched whole; mind that blanks count. Leave it out to
               match every client. -->
          <key>client</key>
          <string>demo,demo-helper</string>
          <!-- Parts of service names with commas between them. Leave it out to match every service. -->
          <key>service</key>
          <string>call</string>
          <!-- The session's level among the sessions of one client and service. -->
          <key>hierarchy</key>
          <integer>0</integer>
          <!-- 1 reports without the user's consent. -->
          <key>override_dnu</key>
          <integer>0</integer>
          <!-- Required, and not empty: where this list is missing, nobody reports. -->
          <key>locale_whitelist</key>
          <array>
            <string>DE</string>
            <string>US</string>
          </array>
          <!-- Parts of device names; every device passes where it is missing. -->
          <key>device_whitelist</key>
          <array>
            <string>desktop</string>
            <string>laptop</string>
          </array>
          <!-- Required, though it may be empty. The first rule that fits a field counts. -->
          <key>filters</key>
          <array>
            <dict>
              <key>key</key>
              <string>token</string>
              <key>action</key>
              <string>remove</string>
            </dict>
            <dict>
              <!-- Only for messages of this category (method) and type (status). -->
              <key>method</key>
              <integer>1</integer>
              <key>status</key>
              <integer>0</integer>
              <key>key</key>
              <string>peer</string>
              <key>action</key>
              <string>sha256</string>
            </dict>
          </array>
          <!-- Required: the share of sessions that report, 0 to 1. -->
          <key>sampling_threshold</key>
          <real>0.1</real>
          <!-- A batch holds one event more than this of each category. -->
          <key>event_threshold</key>
          <integer>49</integer>
          <!-- 1 sends the device ID as client identifier on internal builds. -->
          <key>extras_on_internal</key>
          <integer>0</integer>
          <key>post_url</key>
          <string>https://collector.example.com/events</string>
        </dict>
      </array>
      <!-- Kept, and used for nothing here. -->
      <key>display_url</key>
      <string>https://collector.example.com/show</string>
    </dict>

    <!-- Each message as a UDP datagram. -->
    <key>dashboard</key>
    <dict>
      <!-- An IPv4 address; names are not looked up. -->
      <key>ip</key>
      <string>192.0.2.1</string>
      <key>port</key>
      <integer>16250</integer>
      <!-- Leave it out to send each datagram once; the number is the time between two looks in ms. -->
      <key>reliable</key>
      <integer>8000</integer>
      <!-- The page that clients show. -->
      <key>display_url</key>
      <string>https://dashboard.example.com/show</string>
      <!-- Where log data is posted. -->
      <key>post_url</key>
      <string>https://dashboard.example.com/log-data</string>
    </dict>

    <!-- Whole files, gzipped. -->
    <key>upload_server</key>
    <dict>
      <key>post_url</key>
      <string>https://upload.example.com/files</string>
      <!-- Kept, and used for nothing here. -->
      <key>display_url</key>
      <string>https://upload.example.com/show</string>
    </dict>

    <!-- Each message as an event of the device's power log; needs no settings. -->
    <key>power</key>
    <dict/>

    <!-- Each message to the adaptor in the client's own bundle; for client types 7 and 11, without settings. -->
    <key>pith</key>
    <dict/>
  </dict>
</dict>
</plist>
)";
}

}  // namespace tallyd::storebagtool
