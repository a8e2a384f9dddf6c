// The shipped system-bus policy, loaded into a bus as strict as a stock system bus (stricter:
// signals are denied too): the service may own its name and signal, clients may call the four
// query methods and nothing else.
#include "test_support.h"

#include <dbus/dbus.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

#ifndef QOR_SOURCE_DIR
#error "QOR_SOURCE_DIR must name the source tree"
#endif

using namespace std::chrono_literals;

namespace {

constexpr const char *NAME = "org.vexel.qor";
constexpr const char *PATH = "/Org/Vexel/Qor/Vorn";
constexpr const char *IFACE = "org.vexel.qor.vorn";

std::string replace_all(std::string s, const std::string &from, const std::string &to)
{
	for (size_t at = s.find(from); at != std::string::npos; at = s.find(from, at + to.size()))
		s.replace(at, from.size(), to);
	return s;
}

class BusPolicy : public ::testing::Test {
protected:
	void SetUp() override
	{
		// The policy grants ownership to the daemon's user, root; the test plays that user.
		std::string policy = test_read_file(std::string(QOR_SOURCE_DIR) + "/data/dbus/org.vexel.qor.conf");
		ASSERT_NE(policy.find("user=\"root\""), std::string::npos);
		const passwd *pw = getpwuid(getuid());
		ASSERT_NE(pw, nullptr);
		ASSERT_TRUE(test_write_file(tmp.path + "/qor.conf",
					    replace_all(policy, "user=\"root\"", std::string("user=\"") + pw->pw_name + "\"")));
		std::string socket = tmp.path + "/bus";
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
		ASSERT_TRUE(bus.start({"dbus-daemon", "--config-file=" + tmp.path + "/strict.conf", "--nofork", "--nopidfile"},
				      {}, "", tmp.path + "/bus.err"));
		std::string address = "unix:path=" + socket;
		ASSERT_TRUE(test_wait_for([&] { return (service = connect(address)) != nullptr || !bus.running(); }, 10s));
		ASSERT_NE(service, nullptr) << "the bus refused the policy: " << test_read_file(tmp.path + "/bus.err");
		client = connect(address);
		ASSERT_NE(client, nullptr);
	}

	void TearDown() override
	{
		for (DBusConnection *c : {service, client})
			if (c) {
				dbus_connection_close(c);
				dbus_connection_unref(c);
			}
	}

	static DBusConnection *connect(const std::string &address)
	{
		DBusConnection *c = dbus_connection_open_private(address.c_str(), nullptr);
		if (!c)
			return nullptr;
		if (!dbus_bus_register(c, nullptr)) {
			dbus_connection_close(c);
			dbus_connection_unref(c);
			return nullptr;
		}
		dbus_connection_set_exit_on_disconnect(c, false);
		return c;
	}

	// Owns NAME on the service connection; the bus' verdict as an error name, "" when granted.
	std::string request(const char *name)
	{
		DBusError err;
		dbus_error_init(&err);
		int r = dbus_bus_request_name(service, name, DBUS_NAME_FLAG_DO_NOT_QUEUE, &err);
		std::string verdict = dbus_error_is_set(&err) ? err.name : r == DBUS_REQUEST_NAME_REPLY_PRIMARY_OWNER ? "" : "?";
		dbus_error_free(&err);
		return verdict;
	}

	// What reaches to until a message with member last arrives (messages of one sender keep
	// their order, so anything let through before it is there too).
	static std::vector<std::string> received(DBusConnection *to, int type, const std::string &last)
	{
		std::vector<std::string> got;
		test_wait_for(
			[&] {
				dbus_connection_read_write(to, 10);
				while (DBusMessage *m = dbus_connection_pop_message(to)) {
					if (dbus_message_get_type(m) == type && dbus_message_has_path(m, PATH))
						got.push_back(std::string(dbus_message_get_interface(m)) + "." +
							      dbus_message_get_member(m));
					dbus_message_unref(m);
				}
				return !got.empty() && got.back().ends_with("." + last);
			},
			5s);
		return got;
	}

	static void send(DBusConnection *from, DBusMessage *m)
	{
		dbus_message_set_no_reply(m, true);
		dbus_connection_send(from, m, nullptr);
		dbus_connection_flush(from);
		dbus_message_unref(m);
	}

	test_tmpdir tmp;
	test_process bus;
	DBusConnection *service = nullptr;
	DBusConnection *client = nullptr;
};

const std::string denied = "org.freedesktop.DBus.Error.AccessDenied";

TEST_F(BusPolicy, ServiceOwnsOnlyItsName)
{
	EXPECT_EQ(request(NAME), "");
	EXPECT_EQ(request("org.vexel.other"), denied);
}

TEST_F(BusPolicy, ClientsReachTheFourQueriesOnly)
{
	ASSERT_EQ(request(NAME), "");
	const char *calls[][2] = {{IFACE, "SetVornLevel"}, {"org.vexel.qor.other", "GetVornLevel"},
				  {IFACE, "GetVornLevel"}, {IFACE, "GetSensorTemp"},
				  {IFACE, "GetCooldownTemp"}, {IFACE, "GetFlashLedBlocked"}};
	for (auto &c : calls)
		send(client, dbus_message_new_method_call(NAME, PATH, c[0], c[1]));
	std::vector<std::string> expected{"org.vexel.qor.vorn.GetVornLevel", "org.vexel.qor.vorn.GetSensorTemp",
					  "org.vexel.qor.vorn.GetCooldownTemp", "org.vexel.qor.vorn.GetFlashLedBlocked"};
	EXPECT_EQ(received(service, DBUS_MESSAGE_TYPE_METHOD_CALL, "GetFlashLedBlocked"), expected);
}

TEST_F(BusPolicy, ServiceSignalsOnItsInterfaceOnly)
{
	ASSERT_EQ(request(NAME), "");
	// With an error to fill, the match is in place at the bus before the service signals.
	DBusError err;
	dbus_error_init(&err);
	dbus_bus_add_match(client, "type='signal',path='/Org/Vexel/Qor/Vorn'", &err);
	ASSERT_FALSE(dbus_error_is_set(&err)) << err.message;
	send(service, dbus_message_new_signal(PATH, "org.vexel.qor.other", "ChangedVorn"));
	send(service, dbus_message_new_signal(PATH, IFACE, "ChangedVorn"));
	EXPECT_EQ(received(client, DBUS_MESSAGE_TYPE_SIGNAL, "ChangedVorn"),
		  std::vector<std::string>{"org.vexel.qor.vorn.ChangedVorn"});
}

} // namespace
