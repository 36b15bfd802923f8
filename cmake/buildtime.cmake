# Build date and time for the log's header: SOURCE_DATE_EPOCH in UTC when it is set, else the time of
# configuration. "3/5/07" and "21:48:44": month and day without a leading zero.

if(DEFINED ENV{SOURCE_DATE_EPOCH})
  set(zone UTC)
else()
  set(zone)
endif()
string(TIMESTAMP ORVPATCH_BUILD_DATE "%m/%d/%y" ${zone})
string(TIMESTAMP ORVPATCH_BUILD_TIME "%H:%M:%S" ${zone})
# In one replacement: "^" matches again behind what an earlier replacement took away.
string(REGEX REPLACE "^0?([0-9]+)/0?([0-9]+)/" "\\1/\\2/" ORVPATCH_BUILD_DATE "${ORVPATCH_BUILD_DATE}")
