#pragma once

// The statements that create the tables of the service's database.

#include <string>

namespace adminhost::test {

inline const std::string camerasTable =
    "create table cameras(id integer primary key,name,uuid,create_user_uuid,created_at,update_user_uuid,"
    "updated_at,last_recording_uuid,use_user_uuid,used_at,recording_status,access_control_enabled,disabled);";

/// Every table that reading and writing settings uses.
inline const std::string serviceTables =
    camerasTable +
    "create table workflows(id integer primary key,uuid,bundle_path,disabled,access_control_enabled,"
    "use_user_uuid,created_at,updated_at,used_at);"
    "create table properties(id integer primary key,name,value,protect,created_at,updated_at);"
    "create table access_control_entries(record_uuid,resource_type,resource_id);";

}  // namespace adminhost::test
