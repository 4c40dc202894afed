// SPDX-License-Identifier: GPL-2.0
/*
 * An SPI controller without hardware. Its devices appear as spidev nodes; what they answer is set in
 * sysfs, and what they were asked is read there:
 *
 *   /sys/bus/spi/devices/spiB.C/reply     write "COMMAND BYTE...", all hexadecimal: the bytes that a
 *                                         message which begins by sending COMMAND receives
 *   /sys/bus/spi/devices/spiB.C/error     an errno number: every message fails with it; 0 ends that
 *   /sys/bus/spi/devices/spiB.C/message   the last message, a line for each transfer
 *   /sys/bus/spi/devices/spiB.C/messages  how many messages there were; writing sets the number
 */
#include <linux/ctype.h>
#include <linux/module.h>
#include <linux/platform_device.h>
#include <linux/spi/spi.h>

#define DEVICES 4
#define COMMANDS 256
#define REPLY_SIZE 4
#define MESSAGE_TEXT 1024
#define BUS 7
#define DEVICE_MAX_SPEED_HZ 1000000

struct mock_device {
	u8 reply[COMMANDS][REPLY_SIZE];
	int error;
	unsigned int messages;
	char message[MESSAGE_TEXT];
};

struct mock_controller {
	struct mutex lock; /* what sysfs changes and messages use */
	struct mock_device devices[DEVICES];
};

static struct platform_device *platform;
static struct spi_controller *controller;
static struct spi_device *children[DEVICES];

static struct mock_controller *mock_of(struct device *dev)
{
	return spi_controller_get_devdata(to_spi_device(dev)->controller);
}

static struct mock_device *device_of(struct device *dev)
{
	return &mock_of(dev)->devices[to_spi_device(dev)->chip_select];
}

static ssize_t reply_store(struct device *dev, struct device_attribute *attr, const char *buf,
			   size_t count)
{
	struct mock_controller *mock = mock_of(dev);
	unsigned int command, bytes[REPLY_SIZE];
	int i, found;

	found = sscanf(buf, "%x %x %x %x %x", &command, &bytes[0], &bytes[1], &bytes[2], &bytes[3]);
	if (found < 2 || command >= COMMANDS)
		return -EINVAL;
	mutex_lock(&mock->lock);
	for (i = 0; i < REPLY_SIZE; i++)
		device_of(dev)->reply[command][i] = i < found - 1 ? bytes[i] : 0;
	mutex_unlock(&mock->lock);
	return count;
}
static DEVICE_ATTR_WO(reply);

static ssize_t error_show(struct device *dev, struct device_attribute *attr, char *buf)
{
	return sysfs_emit(buf, "%d\n", device_of(dev)->error);
}

static ssize_t error_store(struct device *dev, struct device_attribute *attr, const char *buf,
			   size_t count)
{
	unsigned int error;

	if (kstrtouint(buf, 10, &error) || error > MAX_ERRNO)
		return -EINVAL;
	mutex_lock(&mock_of(dev)->lock);
	device_of(dev)->error = error;
	mutex_unlock(&mock_of(dev)->lock);
	return count;
}
static DEVICE_ATTR_RW(error);

static ssize_t message_show(struct device *dev, struct device_attribute *attr, char *buf)
{
	ssize_t length;

	mutex_lock(&mock_of(dev)->lock);
	length = sysfs_emit(buf, "%s", device_of(dev)->message);
	mutex_unlock(&mock_of(dev)->lock);
	return length;
}
static DEVICE_ATTR_RO(message);

static ssize_t messages_show(struct device *dev, struct device_attribute *attr, char *buf)
{
	return sysfs_emit(buf, "%u\n", device_of(dev)->messages);
}

static ssize_t messages_store(struct device *dev, struct device_attribute *attr, const char *buf,
			      size_t count)
{
	unsigned int messages;

	if (kstrtouint(buf, 10, &messages))
		return -EINVAL;
	mutex_lock(&mock_of(dev)->lock);
	device_of(dev)->messages = messages;
	mutex_unlock(&mock_of(dev)->lock);
	return count;
}
static DEVICE_ATTR_RW(messages);

static struct attribute *mock_attrs[] = {
	&dev_attr_reply.attr,
	&dev_attr_error.attr,
	&dev_attr_message.attr,
	&dev_attr_messages.attr,
	NULL,
};
ATTRIBUTE_GROUPS(mock);

static void add_bytes(char *text, const char *label, const u8 *bytes, unsigned int count)
{
	size_t used = strlen(text);
	unsigned int i;

	used += scnprintf(text + used, MESSAGE_TEXT - used, "%s", label);
	for (i = 0; i < count; i++)
		used += scnprintf(text + used, MESSAGE_TEXT - used, " %02x", bytes[i]);
}

/* A line such as "tx 1f 00 | len 2 speed 500000 bits 8 delay 0 cs_change 0". */
static void note_transfer(char *text, const struct spi_transfer *transfer)
{
	size_t used;

	if (transfer->tx_buf)
		add_bytes(text, "tx", transfer->tx_buf, transfer->len);
	if (transfer->rx_buf)
		add_bytes(text, transfer->tx_buf ? " rx" : "rx", transfer->rx_buf, transfer->len);
	used = strlen(text);
	scnprintf(text + used, MESSAGE_TEXT - used,
		  " | len %u speed %u bits %u delay %u cs_change %u\n", transfer->len,
		  transfer->speed_hz, transfer->bits_per_word, transfer->delay.value,
		  transfer->cs_change);
}

static const u8 *reply_to(const struct mock_device *device, struct spi_message *message)
{
	const struct spi_transfer *first =
		list_first_entry(&message->transfers, struct spi_transfer, transfer_list);
	u8 command = first->tx_buf && first->len ? *(const u8 *)first->tx_buf : 0;

	return device->reply[command];
}

static void run_transfers(struct mock_device *device, struct spi_message *message)
{
	const u8 *reply = reply_to(device, message);
	struct spi_transfer *transfer;
	unsigned int next = 0, i;

	list_for_each_entry(transfer, &message->transfers, transfer_list) {
		for (i = 0; transfer->rx_buf && i < transfer->len; i++, next++)
			((u8 *)transfer->rx_buf)[i] = next < REPLY_SIZE ? reply[next] : 0;
		note_transfer(device->message, transfer);
		message->actual_length += transfer->len;
	}
}

static int transfer_one_message(struct spi_controller *ctlr, struct spi_message *message)
{
	struct mock_controller *mock = spi_controller_get_devdata(ctlr);
	struct mock_device *device = &mock->devices[message->spi->chip_select];

	mutex_lock(&mock->lock);
	device->messages++;
	device->message[0] = '\0';
	message->status = -device->error;
	if (!device->error)
		run_transfers(device, message);
	mutex_unlock(&mock->lock);
	spi_finalize_current_message(ctlr);
	return 0;
}

static int add_child(unsigned int chip_select)
{
	struct spi_device *spi = spi_alloc_device(controller);
	int ret;

	if (!spi)
		return -ENOMEM;
	spi->chip_select = chip_select;
	spi->max_speed_hz = DEVICE_MAX_SPEED_HZ;
	spi->bits_per_word = 8;
	spi->dev.groups = mock_groups;
	strscpy(spi->modalias, "mock-adc", sizeof(spi->modalias));
	/* No name that spidev knows is ours, so the driver is chosen for it. */
	ret = driver_set_override(&spi->dev, &spi->driver_override, "spidev", strlen("spidev"));
	if (!ret)
		ret = spi_add_device(spi);
	if (ret)
		spi_dev_put(spi);
	else
		children[chip_select] = spi;
	return ret;
}

static int add_controller(void)
{
	struct mock_controller *mock;
	int ret;

	controller = spi_alloc_master(&platform->dev, sizeof(*mock));
	if (!controller)
		return -ENOMEM;
	mock = spi_controller_get_devdata(controller);
	mutex_init(&mock->lock);
	controller->bus_num = BUS;
	controller->num_chipselect = DEVICES;
	controller->bits_per_word_mask = SPI_BPW_RANGE_MASK(1, 32);
	controller->transfer_one_message = transfer_one_message;
	ret = spi_register_controller(controller);
	if (ret)
		spi_controller_put(controller);
	return ret;
}

static int __init mock_spi_init(void)
{
	unsigned int i;
	int ret;

	platform = platform_device_register_simple("mock-spi", PLATFORM_DEVID_NONE, NULL, 0);
	if (IS_ERR(platform))
		return PTR_ERR(platform);
	ret = add_controller();
	if (ret)
		goto no_controller;
	for (i = 0; i < DEVICES && !ret; i++)
		ret = add_child(i);
	if (!ret)
		return 0;
	spi_unregister_controller(controller);
no_controller:
	platform_device_unregister(platform);
	return ret;
}

static void __exit mock_spi_exit(void)
{
	spi_unregister_controller(controller); /* and with it the devices */
	platform_device_unregister(platform);
}

module_init(mock_spi_init);
module_exit(mock_spi_exit);
MODULE_DESCRIPTION("SPI controller without hardware, for tests");
MODULE_LICENSE("GPL");
