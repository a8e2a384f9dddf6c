// The shipped system-bus policy, loaded into a bus as strict as a stock system bus (stricter:
// signals are denied too): the service may own its name and signal, clients may call the four
// query methods and nothing else.
#include "test_support.h"

#include <dbus/dbus.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <memory>
#include <pwd.h>
#include <unistd.h>

#ifndef QOR_SOURCE_DIR
#error "QOR_SOURCE_DIR must name the source tree"
#endif

using namespace std::chrono_literals;

namespace {

constexpr const char *NAME = "org.vexel.qor", *PATH = "/Org/Vexel/Qor/Vorn", *IFACE = "org.vexel.qor.vorn";

using connection = std::unique_ptr<DBusConnection, decltype([](DBusConnection *c) {
	dbus_connection_close(c);
	dbus_connection_unref(c);
})>;

connection open(const std::string &address)
{
	connection c(dbus_connection_open_private(address.c_str(), nullptr));
	if (c && !dbus_bus_register(c.get(), nullptr))
		c.reset();
	return c;
}

// "iface.member" of what reaches to until a message with member last arrives (messages of one
// sender keep their order, so anything let through before it is there too).
std::vector<std::string> received(DBusConnection *to, int type, const std::string &last)
{
	std::vector<std::string> got;
	test_wait_for([&] {
		dbus_connection_read_write(to, 10);
		while (DBusMessage *m = dbus_connection_pop_message(to)) {
			if (dbus_message_get_type(m) == type && dbus_message_has_path(m, PATH))
				got.push_back(std::string(dbus_message_get_interface(m)) + "." + dbus_message_get_member(m));
			dbus_message_unref(m);
		}
		return !got.empty() && got.back().ends_with("." + last);
	}, 5s);
	return got;
}

void send(DBusConnection *from, DBusMessage *m)
{
	dbus_message_set_no_reply(m, true);
	dbus_connection_send(from, m, nullptr);
	dbus_connection_flush(from);
	dbus_message_unref(m);
}

TEST(BusPolicy, ServiceOwnsItsNameAndSignalsClientsCallTheFourQueriesOnly)
{
	test_tmpdir tmp;
	// The policy grants ownership to the daemon's user, root; the test plays that user.
	std::string policy = test_read_file(std::string(QOR_SOURCE_DIR) + "/data/dbus/org.vexel.qor.conf");
	size_t at = policy.find("user=\"root\"");
	ASSERT_NE(at, std::string::npos);
	policy.replace(at, 11, std::string("user=\"") + getpwuid(getuid())->pw_name + "\"");
	ASSERT_TRUE(test_write_file(tmp.path + "/qor.conf", policy));
	const std::string socket = tmp.path + "/bus";
	ASSERT_TRUE(test_write_file(tmp.path + "/strict.conf", R"(<busconfig>
  <type>system</type>
  <listen>unix:path=)" + socket + R"(</listen>
  <auth>EXTERNAL</auth>
  <policy context="default">
    <allow user="*"/>
    <deny own="*"/>
    <deny send_type="method_call"/>
    <deny send_type="signal"/>
    <allow send_requested_reply="true" send_type="method_return"/>
    <allow send_requested_reply="true" send_type="error"/>
    <allow receive_type="method_call"/>
    <allow receive_type="method_return"/>
    <allow receive_type="error"/>
    <allow receive_type="signal"/>
    <allow send_destination="org.freedesktop.DBus" send_interface="org.freedesktop.DBus"/>
  </policy>
  <include>)" + tmp.path + R"(/qor.conf</include>
</busconfig>
)"));
	test_process bus;
	ASSERT_TRUE(bus.start({"dbus-daemon", "--config-file=" + tmp.path + "/strict.conf", "--nofork", "--nopidfile"}, {},
			      "", tmp.path + "/bus.err"));
	ASSERT_TRUE(test_wait_for([&] { return std::filesystem::exists(socket) || !bus.running(); }, 10s));
	connection service = open("unix:path=" + socket), client = open("unix:path=" + socket);
	ASSERT_TRUE(service && client) << "the bus refused the policy: " << test_read_file(tmp.path + "/bus.err");

	EXPECT_EQ(dbus_bus_request_name(service.get(), "org.vexel.other", DBUS_NAME_FLAG_DO_NOT_QUEUE, nullptr), -1) << "denied";
	ASSERT_EQ(dbus_bus_request_name(service.get(), NAME, DBUS_NAME_FLAG_DO_NOT_QUEUE, nullptr), DBUS_REQUEST_NAME_REPLY_PRIMARY_OWNER);

	const char *calls[][2] = {{IFACE, "SetVornLevel"}, {"org.vexel.qor.other", "GetVornLevel"}, {IFACE, "GetVornLevel"},
				  {IFACE, "GetSensorTemp"}, {IFACE, "GetCooldownTemp"}, {IFACE, "GetFlashLedBlocked"}};
	for (auto &c : calls)
		send(client.get(), dbus_message_new_method_call(NAME, PATH, c[0], c[1]));
	EXPECT_EQ(received(service.get(), DBUS_MESSAGE_TYPE_METHOD_CALL, "GetFlashLedBlocked"),
		  (std::vector<std::string>{"org.vexel.qor.vorn.GetVornLevel", "org.vexel.qor.vorn.GetSensorTemp",
					    "org.vexel.qor.vorn.GetCooldownTemp", "org.vexel.qor.vorn.GetFlashLedBlocked"}));

	// With an error to fill, the match is in place at the bus before the service signals.
	DBusError err;
	dbus_error_init(&err);
	dbus_bus_add_match(client.get(), "type='signal',path='/Org/Vexel/Qor/Vorn'", &err);
	ASSERT_FALSE(dbus_error_is_set(&err)) << err.message;
	send(service.get(), dbus_message_new_signal(PATH, "org.vexel.qor.other", "ChangedVorn"));
	send(service.get(), dbus_message_new_signal(PATH, IFACE, "ChangedVorn"));
	EXPECT_EQ(received(client.get(), DBUS_MESSAGE_TYPE_SIGNAL, "ChangedVorn"),
		  std::vector<std::string>{"org.vexel.qor.vorn.ChangedVorn"});
}

} // namespace
