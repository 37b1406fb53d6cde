// SPDX-License-Identifier: GPL-2.0-only
/*
 * TesvarSmartBattery: a reference battery for test rigs.
 *
 * It publishes one battery, "tesvar_battery", with the standard properties of
 * the power-supply class and the chemistry ID the battery model is chosen by
 * (algo_chem_id), and the mains supply that charges it, "tesvar_ac". The
 * chemistry ID, the serial number and whether the mains supply is online
 * are module parameters that may be changed while the module is loaded
 * (/sys/module/tesvar_smart_battery/parameters/), so that a rig can present
 * another battery, or unplug it, without reloading anything; every change is
 * announced with a change uevent like a real supply's.
 */

#include <linux/bitops.h>
#include <linux/ctype.h>
#include <linux/device.h>
#include <linux/kernel.h>
#include <linux/module.h>
#include <linux/moduleparam.h>
#include <linux/platform_device.h>
#include <linux/power_supply.h>
#include <linux/spinlock.h>
#include <linux/string.h>
#include <linux/sysfs.h>

#define TESVAR_BATTERY_DRIVER	"TesvarSmartBattery"
#define TESVAR_BATTERY_SUPPLY	"tesvar_battery"
#define TESVAR_AC_SUPPLY	"tesvar_ac"
/* Room for a gauge's serial number and its NUL. */
#define TESVAR_SERIAL_SIZE	32

/*
 * The parameters belong to the module, the battery to the device: the lock
 * keeps each parameter whole for readers and keeps the battery from going
 * away under a parameter's change announcement.
 */
static DEFINE_SPINLOCK(tesvar_battery_lock);
/* 0x2168: the chemistry of the example device's battery. */
static unsigned int chem_id = 8552;
static char serial_number[TESVAR_SERIAL_SIZE] = "F5D2470A1B2C3D4E5";
static bool ac_online = true;
static struct power_supply *tesvar_battery;
static struct power_supply *tesvar_ac;

/* The supplies' names are the driver's: one device at a time may have them. */
static unsigned long tesvar_battery_bound;

static struct platform_device *tesvar_battery_pdev;

static void tesvar_battery_changed_locked(void)
{
	lockdep_assert_held(&tesvar_battery_lock);
	if (tesvar_battery)
		power_supply_changed(tesvar_battery);
}

static bool tesvar_ac_online(void)
{
	bool online;

	spin_lock(&tesvar_battery_lock);
	online = ac_online;
	spin_unlock(&tesvar_battery_lock);
	return online;
}

/*
 * Decimal, or hexadecimal after "0x": never octal, whatever the leading
 * zeros, and nothing else but the line feed "echo" ends its output with. A
 * value refused leaves the parameter as it was.
 */
static int chem_id_set(const char *val, const struct kernel_param *kp)
{
	unsigned int base = 10, id;
	size_t digits;

	if (val[0] == '0' && val[1] == 'x') {
		base = 16;
		val += 2;
	}
	digits = strspn(val, base == 16 ? "0123456789abcdefABCDEF" :
				       "0123456789");
	if (!digits || (val[digits] && strcmp(val + digits, "\n")))
		return -EINVAL;
	/* The digits are checked: only a value above 32 bits fails here. */
	if (kstrtouint(val, base, &id))
		return -EINVAL;

	spin_lock(&tesvar_battery_lock);
	chem_id = id;
	tesvar_battery_changed_locked();
	spin_unlock(&tesvar_battery_lock);
	return 0;
}

static int chem_id_get(char *buf, const struct kernel_param *kp)
{
	unsigned int id;

	spin_lock(&tesvar_battery_lock);
	id = chem_id;
	spin_unlock(&tesvar_battery_lock);
	return sysfs_emit(buf, "%u\n", id);
}

static const struct kernel_param_ops chem_id_ops = {
	.set = chem_id_set,
	.get = chem_id_get,
};
module_param_cb(chem_id, &chem_id_ops, NULL, 0644);
__MODULE_PARM_TYPE(chem_id, "uint");
MODULE_PARM_DESC(chem_id, "battery chemistry ID (algo_chem_id), decimal or 0x hex, default 8552");

/*
 * Printable ASCII only: the value goes out as it is in sysfs and in the
 * uevent, where a line feed or a control byte would forge another line or
 * variable. One final line feed, as "echo" writes it, is not part of it. A
 * value refused leaves the parameter as it was.
 */
static int serial_number_set(const char *val, const struct kernel_param *kp)
{
	size_t len = strlen(val), i;

	if (len && val[len - 1] == '\n')
		len--;
	if (len >= TESVAR_SERIAL_SIZE)
		return -EINVAL;
	for (i = 0; i < len; i++)
		if (!isascii(val[i]) || !isprint(val[i]))
			return -EINVAL;

	spin_lock(&tesvar_battery_lock);
	memcpy(serial_number, val, len);
	serial_number[len] = '\0';
	tesvar_battery_changed_locked();
	spin_unlock(&tesvar_battery_lock);
	return 0;
}

static int serial_number_get(char *buf, const struct kernel_param *kp)
{
	int ret;

	spin_lock(&tesvar_battery_lock);
	ret = sysfs_emit(buf, "%s\n", serial_number);
	spin_unlock(&tesvar_battery_lock);
	return ret;
}

static const struct kernel_param_ops serial_number_ops = {
	.set = serial_number_set,
	.get = serial_number_get,
};
module_param_cb(serial_number, &serial_number_ops, NULL, 0644);
__MODULE_PARM_TYPE(serial_number, "string");
MODULE_PARM_DESC(serial_number, "battery serial number, at most 31 printable ASCII characters");

static int ac_online_set(const char *val, const struct kernel_param *kp)
{
	bool online;
	int ret;

	ret = kstrtobool(val, &online);
	if (ret)
		return ret;

	spin_lock(&tesvar_battery_lock);
	ac_online = online;
	/* Plugged in or out, the battery's status changes with the mains'. */
	if (tesvar_ac)
		power_supply_changed(tesvar_ac);
	tesvar_battery_changed_locked();
	spin_unlock(&tesvar_battery_lock);
	return 0;
}

static int ac_online_get(char *buf, const struct kernel_param *kp)
{
	return sysfs_emit(buf, "%c\n", tesvar_ac_online() ? 'Y' : 'N');
}

static const struct kernel_param_ops ac_online_ops = {
	.set = ac_online_set,
	.get = ac_online_get,
};
module_param_cb(ac_online, &ac_online_ops, NULL, 0644);
__MODULE_PARM_TYPE(ac_online, "bool");
MODULE_PARM_DESC(ac_online, "whether the mains supply is online, default Y");

static enum power_supply_property tesvar_ac_props[] = {
	POWER_SUPPLY_PROP_ONLINE,
};

static int tesvar_ac_get_property(struct power_supply *psy,
				  enum power_supply_property psp,
				  union power_supply_propval *val)
{
	if (psp != POWER_SUPPLY_PROP_ONLINE)
		return -EINVAL;
	val->intval = tesvar_ac_online();
	return 0;
}

static enum power_supply_property tesvar_battery_props[] = {
	POWER_SUPPLY_PROP_STATUS,
	POWER_SUPPLY_PROP_HEALTH,
	POWER_SUPPLY_PROP_PRESENT,
	POWER_SUPPLY_PROP_TECHNOLOGY,
	POWER_SUPPLY_PROP_CYCLE_COUNT,
	POWER_SUPPLY_PROP_VOLTAGE_MAX_DESIGN,
	POWER_SUPPLY_PROP_VOLTAGE_MIN_DESIGN,
	POWER_SUPPLY_PROP_VOLTAGE_NOW,
	POWER_SUPPLY_PROP_CURRENT_NOW,
	POWER_SUPPLY_PROP_CHARGE_FULL_DESIGN,
	POWER_SUPPLY_PROP_CHARGE_FULL,
	POWER_SUPPLY_PROP_CHARGE_NOW,
	POWER_SUPPLY_PROP_CAPACITY,
	POWER_SUPPLY_PROP_CAPACITY_LEVEL,
	POWER_SUPPLY_PROP_TEMP,
	POWER_SUPPLY_PROP_SCOPE,
	POWER_SUPPLY_PROP_MODEL_NAME,
	POWER_SUPPLY_PROP_MANUFACTURER,
	POWER_SUPPLY_PROP_SERIAL_NUMBER,
};

static int tesvar_battery_get_property(struct power_supply *psy,
				       enum power_supply_property psp,
				       union power_supply_propval *val)
{
	switch (psp) {
	case POWER_SUPPLY_PROP_STATUS:
		val->intval = tesvar_ac_online() ? POWER_SUPPLY_STATUS_CHARGING :
			      POWER_SUPPLY_STATUS_DISCHARGING;
		break;
	case POWER_SUPPLY_PROP_HEALTH:
		val->intval = POWER_SUPPLY_HEALTH_GOOD;
		break;
	case POWER_SUPPLY_PROP_PRESENT:
		val->intval = 1;
		break;
	case POWER_SUPPLY_PROP_TECHNOLOGY:
		val->intval = POWER_SUPPLY_TECHNOLOGY_LION;
		break;
	case POWER_SUPPLY_PROP_CYCLE_COUNT:
		val->intval = 142;
		break;
	case POWER_SUPPLY_PROP_VOLTAGE_MAX_DESIGN:
		val->intval = 4400000;
		break;
	case POWER_SUPPLY_PROP_VOLTAGE_MIN_DESIGN:
		val->intval = 3000000;
		break;
	case POWER_SUPPLY_PROP_VOLTAGE_NOW:
		val->intval = 3871000;
		break;
	case POWER_SUPPLY_PROP_CURRENT_NOW:
		val->intval = tesvar_ac_online() ? 1250000 : -412000;
		break;
	case POWER_SUPPLY_PROP_CHARGE_FULL_DESIGN:
		val->intval = 3110000;
		break;
	case POWER_SUPPLY_PROP_CHARGE_FULL:
		val->intval = 2984000;
		break;
	case POWER_SUPPLY_PROP_CHARGE_NOW:
		val->intval = 2148000;
		break;
	case POWER_SUPPLY_PROP_CAPACITY:
		val->intval = 72;
		break;
	case POWER_SUPPLY_PROP_CAPACITY_LEVEL:
		val->intval = POWER_SUPPLY_CAPACITY_LEVEL_NORMAL;
		break;
	case POWER_SUPPLY_PROP_TEMP:
		val->intval = 263;	/* tenths of a degree Celsius */
		break;
	case POWER_SUPPLY_PROP_SCOPE:
		val->intval = POWER_SUPPLY_SCOPE_SYSTEM;
		break;
	case POWER_SUPPLY_PROP_MODEL_NAME:
		val->strval = "Tesvar reference battery";
		break;
	case POWER_SUPPLY_PROP_MANUFACTURER:
		val->strval = "Tesvar";
		break;
	case POWER_SUPPLY_PROP_SERIAL_NUMBER:
		/*
		 * The class prints strval after this returns, outside any
		 * lock of ours: a read that meets a change may mix old and
		 * new characters, and the change uevent that follows carries
		 * the settled value. The last byte of the buffer is never
		 * written, so a reader always finds the end of the string.
		 */
		val->strval = serial_number;
		break;
	default:
		return -EINVAL;
	}
	return 0;
}

static ssize_t algo_chem_id_show(struct device *dev,
				 struct device_attribute *attr, char *buf)
{
	unsigned int id;

	spin_lock(&tesvar_battery_lock);
	id = chem_id;
	spin_unlock(&tesvar_battery_lock);
	return sysfs_emit(buf, "%u\n", id);
}
static DEVICE_ATTR_RO(algo_chem_id);

static struct attribute *tesvar_battery_attrs[] = {
	&dev_attr_algo_chem_id.attr,
	NULL
};
ATTRIBUTE_GROUPS(tesvar_battery);

static const struct power_supply_desc tesvar_battery_desc = {
	.name = TESVAR_BATTERY_SUPPLY,
	.type = POWER_SUPPLY_TYPE_BATTERY,
	.properties = tesvar_battery_props,
	.num_properties = ARRAY_SIZE(tesvar_battery_props),
	.get_property = tesvar_battery_get_property,
};

static char *tesvar_ac_supplied_to[] = {
	TESVAR_BATTERY_SUPPLY,
};

static const struct power_supply_desc tesvar_ac_desc = {
	.name = TESVAR_AC_SUPPLY,
	.type = POWER_SUPPLY_TYPE_MAINS,
	.properties = tesvar_ac_props,
	.num_properties = ARRAY_SIZE(tesvar_ac_props),
	.get_property = tesvar_ac_get_property,
};

static void tesvar_battery_forget(void *data)
{
	spin_lock(&tesvar_battery_lock);
	tesvar_battery = NULL;
	tesvar_ac = NULL;
	spin_unlock(&tesvar_battery_lock);
}

static void tesvar_battery_unbind(void *data)
{
	clear_bit(0, &tesvar_battery_bound);
}

static int tesvar_battery_probe(struct platform_device *pdev)
{
	struct power_supply_config cfg = {};
	struct power_supply_config ac_cfg = {};
	struct power_supply *psy, *ac;
	int ret;

	/*
	 * Another device given this driver (driver_override) is refused
	 * before anything is created: its supplies would have the same names.
	 */
	if (test_and_set_bit(0, &tesvar_battery_bound))
		return dev_err_probe(&pdev->dev, -EBUSY,
				     "%s belongs to another device\n",
				     TESVAR_BATTERY_SUPPLY);
	ret = devm_add_action_or_reset(&pdev->dev, tesvar_battery_unbind, NULL);
	if (ret)
		return ret;

	cfg.attr_grp = tesvar_battery_groups;
	psy = devm_power_supply_register(&pdev->dev, &tesvar_battery_desc,
					 &cfg);
	if (IS_ERR(psy))
		return dev_err_probe(&pdev->dev, PTR_ERR(psy),
				     "cannot register %s\n",
				     TESVAR_BATTERY_SUPPLY);

	ac_cfg.supplied_to = tesvar_ac_supplied_to;
	ac_cfg.num_supplicants = ARRAY_SIZE(tesvar_ac_supplied_to);
	ac = devm_power_supply_register(&pdev->dev, &tesvar_ac_desc, &ac_cfg);
	if (IS_ERR(ac))
		return dev_err_probe(&pdev->dev, PTR_ERR(ac),
				     "cannot register %s\n", TESVAR_AC_SUPPLY);

	spin_lock(&tesvar_battery_lock);
	tesvar_battery = psy;
	tesvar_ac = ac;
	spin_unlock(&tesvar_battery_lock);
	/* Released first: no change is announced to a supply being removed. */
	return devm_add_action_or_reset(&pdev->dev, tesvar_battery_forget, NULL);
}

static struct platform_driver tesvar_battery_driver = {
	.probe = tesvar_battery_probe,
	.driver = {
		.name = TESVAR_BATTERY_DRIVER,
	},
};

static int __init tesvar_battery_init(void)
{
	int ret;

	ret = platform_driver_register(&tesvar_battery_driver);
	if (ret)
		return ret;

	tesvar_battery_pdev = platform_device_register_simple(TESVAR_BATTERY_DRIVER,
							      PLATFORM_DEVID_NONE,
							      NULL, 0);
	if (IS_ERR(tesvar_battery_pdev)) {
		platform_driver_unregister(&tesvar_battery_driver);
		return PTR_ERR(tesvar_battery_pdev);
	}
	return 0;
}
module_init(tesvar_battery_init);

static void __exit tesvar_battery_exit(void)
{
	platform_device_unregister(tesvar_battery_pdev);
	platform_driver_unregister(&tesvar_battery_driver);
}
module_exit(tesvar_battery_exit);

MODULE_DESCRIPTION("Tesvar reference smart battery for test rigs");
MODULE_LICENSE("GPL");
